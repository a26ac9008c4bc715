/* The stable interface of treehfs for C: volumes in images, and the records of their B-trees.
 *
 * Every call that can fail returns a status: 0 (TREEHFS_OK), or one of the TREEHFS_ERR_ values.
 * treehfs_last_error says in words what the calling thread's last failure was.
 *
 * Keys and data are bytes as they lie on disk: big-endian, a key with its length field in front.
 * treehfs_key_parse and treehfs_key_text translate keys to and from text.
 *
 * Handles belong to the caller until the matching close. A volume and its cursors are used by one
 * thread at a time. A null handle or pointer where one is needed gives TREEHFS_ERR_INVALID.
 *
 * Structs begin with their size, which the caller sets (TREEHFS_INIT): they may grow at their end
 * in later versions without breaking programs that were compiled before.
 */
#ifndef TREEHFS_TREEHFS_H
#define TREEHFS_TREEHFS_H

#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/* Before each function that the shared library offers. */
#if defined(__GNUC__)
#define TREEHFS_API __attribute__((visibility("default")))
#else
#define TREEHFS_API
#endif

/* --- statuses --------------------------------------------------------------------------------- */

#define TREEHFS_OK 0                              /* done */
#define TREEHFS_ERR_INVALID ((int)0xA0000101u)    /* cannot be served, or no room */
#define TREEHFS_ERR_BAD_RECORD ((int)0xA0000106u) /* a bad-block record has the wrong size */
#define TREEHFS_ERR_NO_MEMORY ((int)0xA0000107u)  /* out of memory */
#define TREEHFS_ERR_NOT_FOUND ((int)0xA000010Eu)  /* no such key, or the end of the records */
#define TREEHFS_ERR_EXISTS ((int)0xA000010Fu)     /* the key is there already */
#define TREEHFS_ERR_TOO_LARGE ((int)0xA0000115u)  /* key and data are larger than a node */
#define TREEHFS_ERR_CORRUPT ((int)0xA000011Cu)    /* the tree contradicts itself */
#define TREEHFS_ERR_NO_SPACE ((int)0xA0000123u)   /* the volume cannot supply a node */
#define TREEHFS_ERR_IO ((int)0xA0000201u)         /* the image could not be read or written */
#define TREEHFS_ERR_TRUNCATED ((int)0xA0000202u)  /* past the end of the image */
#define TREEHFS_ERR_READ_ONLY ((int)0xA0000203u)  /* the volume takes no changes */
#define TREEHFS_ERR_UNMAPPED ((int)0xA0000204u)   /* past the extents of the tree file */
#define TREEHFS_ERR_JOURNAL ((int)0xA0000205u)    /* more changes than the journal holds */
#define TREEHFS_ERR_OPEN ((int)0xA0000206u)       /* no volume can be opened there */
#define TREEHFS_ERR_NO_TREE ((int)0xA0000207u)    /* the volume has no such tree */
#define TREEHFS_ERR_CLOSED ((int)0xA0000208u)     /* the volume is closed */
#define TREEHFS_ERR_BUFFER ((int)0xA0000209u)     /* the buffer is too small; its size says how */

/* "not-found", "corrupt", ...; "status" for a value that is none of these. Never null. */
TREEHFS_API const char* treehfs_status_name(int status);
/* "no such key, or the end of the records". Never null. */
TREEHFS_API const char* treehfs_status_text(int status);
/* What the last failed call of this thread met, with its place; "" before the first. Valid until
 * the thread's next call. */
TREEHFS_API const char* treehfs_last_error(void);
/* Version of the library, as in "0.1.0". */
TREEHFS_API const char* treehfs_version(void);

/* Sets a struct to zeros and its size: treehfs_record record = TREEHFS_INIT(treehfs_record);
 * In C++: treehfs_record record{}; record.struct_size = sizeof record; */
#ifndef __cplusplus
#define TREEHFS_INIT(type) \
    { .struct_size = sizeof(type) }
#endif

/* --- volumes ---------------------------------------------------------------------------------- */

/* An open volume: opaque, from treehfs_open to treehfs_close. */
typedef struct treehfs_volume treehfs_volume;

#define TREEHFS_READ 0u    /* changes are refused */
#define TREEHFS_OVERLAY 1u /* changes stay in memory, the image is never written */
#define TREEHFS_WRITE 2u   /* a commit reaches the image */

#define TREEHFS_OPEN_AT_OFFSET 1u     /* the volume begins at byte `offset` of the image */
#define TREEHFS_OPEN_FORCE 2u         /* write past a full journal or an unclean unmount */
#define TREEHFS_OPEN_REPLAY 4u        /* carry the journal out first */
#define TREEHFS_OPEN_BACKUP_HEADER 8u /* start from the alternate volume header */

/* How to open a volume. */
typedef struct treehfs_open_options {
    uint32_t struct_size; /* sizeof this struct */
    uint32_t access;      /* TREEHFS_READ, ... */
    uint32_t flags;       /* TREEHFS_OPEN_... */
    uint32_t partition;   /* number of the partition; 0: whichever holds a volume */
    uint64_t offset;      /* bytes, with TREEHFS_OPEN_AT_OFFSET */
    uint64_t cache_bytes; /* of nodes to keep; 0: 8 MiB */
} treehfs_open_options;

/* Opens the volume in the image, disk image or block device `path`; `options` may be null. */
TREEHFS_API int treehfs_open(const char* path, const treehfs_open_options* options,
                             treehfs_volume** volume);
/* Ends the volume; changes that were not committed are gone. The handle is gone whatever is
 * returned; cursors stay to be closed. Null is allowed. */
TREEHFS_API int treehfs_close(treehfs_volume* volume);

#define TREEHFS_VOLUME_HFSX 1u            /* HFSX; otherwise HFS+ */
#define TREEHFS_VOLUME_JOURNALED 2u       /* has a journal */
#define TREEHFS_VOLUME_JOURNAL_PENDING 4u /* transactions wait in the journal */
#define TREEHFS_VOLUME_TRUNCATED 8u       /* the image ends before the volume */
#define TREEHFS_VOLUME_WRITABLE 16u       /* takes changes */
#define TREEHFS_VOLUME_BACKUP_HEADER 32u  /* was read through its alternate header */

/* Dates are seconds since 1904-01-01, UTC (create_date: local time); 0: not set. */
typedef struct treehfs_volume_info {
    uint32_t struct_size;  /* sizeof this struct */
    uint32_t flags;        /* TREEHFS_VOLUME_... */
    uint64_t offset;       /* of the volume in the image, bytes */
    uint32_t block_size;   /* allocation block, bytes */
    uint32_t total_blocks; /* allocation blocks */
    uint32_t free_blocks;  /* of these, in nobody's use */
    uint32_t file_count;   /* files, as the volume header says */
    uint32_t folder_count; /* folders but the root, as the volume header says */
    uint32_t next_id;      /* ID that the next new file or folder gets */
    uint32_t create_date;  /* when the volume was made; local time */
    uint32_t modify_date;  /* last change */
    uint32_t backup_date;  /* last backup */
    uint32_t checked_date; /* last check */
} treehfs_volume_info;

/* Fills `info`, up to the size it names. */
TREEHFS_API int treehfs_get_volume_info(treehfs_volume* volume, treehfs_volume_info* info);
/* Things worth knowing although the volume opened, one by one; null behind the last. Valid until
 * the volume is closed. */
TREEHFS_API const char* treehfs_note(treehfs_volume* volume, uint32_t index);

/* --- trees ------------------------------------------------------------------------------------ */

/* Which tree: its file ID. */
#define TREEHFS_EXTENTS 3u
#define TREEHFS_CATALOG 4u
#define TREEHFS_ATTRIBUTES 8u

/* The header of a tree (docs/format.md). */
typedef struct treehfs_tree_info {
    uint32_t struct_size;    /* sizeof this struct */
    uint32_t node_size;      /* bytes */
    uint32_t depth;          /* levels; 0: the tree is empty */
    uint32_t root_node;      /* node number; 0: the tree is empty */
    uint32_t first_leaf;     /* node number of the leaf with the smallest keys */
    uint32_t last_leaf;      /* node number of the leaf with the greatest keys */
    uint32_t leaf_records;   /* records in all leaves */
    uint32_t total_nodes;    /* nodes of the file, used or free */
    uint32_t free_nodes;     /* of these, not in use */
    uint32_t max_key_length; /* bytes, without the length field */
    uint32_t attributes;     /* of the header record */
    uint32_t key_compare;    /* 0xBC binary, 0xCF case-insensitive, 0 before HFSX */
} treehfs_tree_info;

/* TREEHFS_ERR_NO_TREE: the volume has no such tree. */
TREEHFS_API int treehfs_get_tree_info(treehfs_volume* volume, uint32_t tree,
                                      treehfs_tree_info* info);

/* --- keys and records as text ----------------------------------------------------------------- */
/* These need no volume. `*size` becomes the bytes of the result, without a text's ending 0, also
 * with TREEHFS_ERR_BUFFER; a text needs room for one byte more. */

/* Longest key, its length field included, bytes. */
#define TREEHFS_KEY_BYTES 522u

/* 2:"name" (catalog), 5:data:0 (extents), 37:"name" (attributes), hex:... (any) -> bytes. */
TREEHFS_API int treehfs_key_parse(uint32_t tree, const char* text, void* key, uint32_t capacity,
                                  uint32_t* size);
/* The way back. */
TREEHFS_API int treehfs_key_text(uint32_t tree, const void* key, uint32_t key_size, char* text,
                                 uint32_t capacity, uint32_t* size);
/* folder{id:16,...}, inline{"text"}, hex:... -> bytes. */
TREEHFS_API int treehfs_data_parse(uint32_t tree, const char* text, void* data, uint32_t capacity,
                                   uint32_t* size);
/* One record as the line of JSON that `treehfs export` writes, without line feed. */
TREEHFS_API int treehfs_record_json(uint32_t tree, const void* key, uint32_t key_size,
                                    const void* data, uint32_t data_size, char* text,
                                    uint32_t capacity, uint32_t* size);

/* --- looking ---------------------------------------------------------------------------------- */

/* Copies the data of the record with this key. `*size` becomes its bytes, also with
 * TREEHFS_ERR_BUFFER. TREEHFS_ERR_NOT_FOUND: no such key. `data` may be null with capacity 0. */
TREEHFS_API int treehfs_find(treehfs_volume* volume, uint32_t tree, const void* key,
                             uint32_t key_size, void* data, uint32_t capacity, uint32_t* size);

/* A walk in key order: opaque, from treehfs_cursor_open to treehfs_cursor_close. */
typedef struct treehfs_cursor treehfs_cursor;

/* A record under a cursor; the bytes are the cursor's, valid until its next call. */
typedef struct treehfs_record {
    uint32_t struct_size; /* sizeof this struct */
    uint32_t id;          /* parent ID of a catalog key, else the file ID */
    const void* key;      /* as on disk, length field included */
    const void* data;     /* as on disk */
    uint32_t key_size;    /* bytes */
    uint32_t data_size;   /* bytes */
    uint32_t node;        /* number of the leaf it lies in */
    uint32_t index;       /* which record of that leaf, from 0 */
} treehfs_record;

/* Stands before the first record whose key is not below `key`; null: before the first of all. */
TREEHFS_API int treehfs_cursor_open(treehfs_volume* volume, uint32_t tree, const void* key,
                                    uint32_t key_size, treehfs_cursor** cursor);
/* Delivers the next record in key order; TREEHFS_ERR_NOT_FOUND at the end. Records may change
 * between two calls: the walk goes on behind the key delivered last. TREEHFS_ERR_CLOSED: the volume
 * was closed. */
TREEHFS_API int treehfs_cursor_next(treehfs_cursor* cursor, treehfs_record* record);
/* Null is allowed. */
TREEHFS_API void treehfs_cursor_close(treehfs_cursor* cursor);

/* --- changing --------------------------------------------------------------------------------- */
/* All changes since the volume was opened, or since its last commit or rollback, are one
 * transaction over all trees: a commit keeps them together, also over a cut of the power on a
 * journaled volume (docs/durability.md).
 *
 * TREEHFS_ERR_NOT_FOUND, _EXISTS and _TOO_LARGE of a change have changed nothing. Any other failure
 * has dropped the transaction: the next changes and the commit return that status, until a rollback
 * says that it was noticed. */

/* Marks the start of changes that belong together. TREEHFS_ERR_INVALID: others wait already. */
TREEHFS_API int treehfs_begin(treehfs_volume* volume);
/* Keeps all changes since the last commit, or none of them. */
TREEHFS_API int treehfs_commit(treehfs_volume* volume);
/* Drops all changes since the last commit. */
TREEHFS_API int treehfs_rollback(treehfs_volume* volume);

/* Adds a record; TREEHFS_ERR_EXISTS: the key is there. */
TREEHFS_API int treehfs_insert(treehfs_volume* volume, uint32_t tree, const void* key,
                               uint32_t key_size, const void* data, uint32_t data_size);
/* The new data may have another size. */
TREEHFS_API int treehfs_update(treehfs_volume* volume, uint32_t tree, const void* key,
                               uint32_t key_size, const void* data, uint32_t data_size);
/* Removes the record with this key. */
TREEHFS_API int treehfs_delete(treehfs_volume* volume, uint32_t tree, const void* key,
                               uint32_t key_size);

/* --- checking --------------------------------------------------------------------------------- */

#define TREEHFS_CHECK_QUICK 1u      /* headers, map and leaf chain only */
#define TREEHFS_CHECK_FULL 2u       /* also the trees against each other and the bitmap */
#define TREEHFS_CHECK_KEEP_GOING 4u /* go on in a tree after a node that cannot be read */

#define TREEHFS_INFO 0u    /* a remark */
#define TREEHFS_WARNING 1u /* a number nothing relies on alone */
#define TREEHFS_ERROR 2u   /* makes a reader go wrong */

/* How thorough a check is. */
typedef struct treehfs_check_options {
    uint32_t struct_size; /* sizeof this struct */
    uint32_t flags;       /* TREEHFS_CHECK_... */
    uint32_t max_errors;  /* stop at so many; 0: no limit */
} treehfs_check_options;

/* A broken invariant. The texts are valid during the callback. */
typedef struct treehfs_finding {
    uint32_t struct_size; /* sizeof this struct */
    uint32_t severity;    /* TREEHFS_INFO, ... */
    const char* id;       /* "K03"; docs/check.md lists them */
    uint32_t tree;        /* TREEHFS_CATALOG, ...; 0: the volume */
    int32_t record;       /* index in the node; -1: none in particular */
    int64_t node;         /* -1: none in particular */
    uint64_t offset;      /* byte of the image; UINT64_MAX: none in particular */
    const char* where;    /* "catalog node 14 record 0" */
    const char* text;     /* one sentence */
} treehfs_finding;

/* What a check found. */
typedef struct treehfs_check_summary {
    uint32_t struct_size; /* sizeof this struct */
    uint32_t errors;      /* findings of that severity */
    uint32_t warnings;    /* findings of that severity */
    uint32_t infos;       /* findings of that severity */
    uint32_t unreadable;  /* pieces that could not be read */
    uint32_t stopped;     /* 1: the run did not come to its end */
    uint64_t nodes;       /* visited */
    uint64_t bytes;       /* read */
} treehfs_check_summary;

/* Not 0: stop the run soon. Must not call back into the volume. */
typedef int (*treehfs_finding_fn)(void* self, const treehfs_finding* finding);

/* Judges the volume by its bytes, independently of what reads and changes its trees. TREEHFS_OK
 * says that the run took place: what it found is in `summary`. `options`, `told` and `summary` may
 * be null. TREEHFS_ERR_INVALID: there are changes that were not committed. */
TREEHFS_API int treehfs_check(treehfs_volume* volume, const treehfs_check_options* options,
                              treehfs_finding_fn told, void* self, treehfs_check_summary* summary);

#ifdef __cplusplus
}
#endif

#endif
