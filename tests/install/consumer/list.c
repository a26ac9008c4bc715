/* Counts the catalog's records. */
#include <stdio.h>
#include <treehfs/treehfs.h>

int main(int argc, char **argv) {
    treehfs_record record = TREEHFS_INIT(treehfs_record);
    treehfs_volume *volume = NULL;
    treehfs_cursor *cursor = NULL;
    int count = 0;
    int status = treehfs_open(argc > 1 ? argv[1] : "", NULL, &volume);
    if (status == TREEHFS_OK) {
        status = treehfs_cursor_open(volume, TREEHFS_CATALOG, NULL, 0, &cursor);
    }
    while (status == TREEHFS_OK) {
        status = treehfs_cursor_next(cursor, &record);
        count += status == TREEHFS_OK;
    }
    printf("%d records, then %s\n", count, treehfs_status_name(status));
    treehfs_cursor_close(cursor);
    treehfs_close(volume);
    return 0;
}
