// The tree file's fork. See space_fork.h.
#include "hfs/treehfs/space_fork.h"

#include "platform/trace.h"

namespace VELK {

HfsFork* FindFork(CBTreeHfs* tree) {
    HfsFork* fork = tree->volume->ForkOf(tree->fileId);
    if (fork == nullptr) {
        // This check belongs to the volume's table of forks and prints under its name.
        _VELKTrace("***** velk_assert src/hfs/fshfs, 1090\n");
    }
    return fork;
}

int ResizeFork(CBTreeHfs* tree, u64 size) {
    tree->volume->nesting += 1;
    const int status = tree->volume->Resize(&tree->runs, nullptr, 0, tree->fileId, size);
    tree->volume->nesting -= 1;
    return status;
}

}  // namespace VELK
