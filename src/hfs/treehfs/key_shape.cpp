// See key_shape.h.
#include "hfs/treehfs/key_shape.h"

#include "hfs/treehfs/bytes.h"

namespace VELK {

bool NodeKeyIsSound(const CBTreeHfs* tree, const BTreeKey* key, u32 keySize) {
    KeyShape shape;
    if (!ShapeOf(tree->compareKeys, &shape)) {
        return true;
    }
    const u32 keyLength = keySize - kKeyLengthSize;
    if (keyLength > kMaxKeyLength || keyLength < shape.fixed) {
        return false;
    }
    // The whole key, not the two bytes of its length field.
    const u8* bytes = reinterpret_cast<const u8*>(key);
    return shape.nameLength == 0 ||
           shape.fixed + 2u * GetBe16(bytes + shape.nameLength) <= keyLength;
}

}  // namespace VELK
