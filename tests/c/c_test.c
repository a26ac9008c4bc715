/* The C interface as a C program uses it. Every step prints a line when it is not as it should be.
 *
 * usage: c_test IMAGE    IMAGE is a copy of tests/data/writable.img.gz, and is written to */
#include <stdarg.h>
#include <stdio.h>
#include <string.h>
#include <treehfs/treehfs.h>

static int failures;

static void fail(int line, const char* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    printf("line %d: ", line);
    vprintf(format, arguments);
    printf("\n");
    va_end(arguments);
    failures += 1;
}

#define WANT_STATUS(call, want)                                                         \
    do {                                                                                \
        const int have_ = (call);                                                       \
        if (have_ != (want)) {                                                          \
            fail(__LINE__, "%s: %s, wanted %s (%s)", #call, treehfs_status_name(have_), \
                 treehfs_status_name(want), treehfs_last_error());                      \
        }                                                                               \
    } while (0)

#define WANT_TEXT(have, want)                                                              \
    do {                                                                                   \
        const char* text_ = (have);                                                        \
        if (text_ == NULL || strcmp(text_, (want)) != 0) {                                 \
            fail(__LINE__, "'%s', wanted '%s'", text_ != NULL ? text_ : "(null)", (want)); \
        }                                                                                  \
    } while (0)

#define WANT(condition)                               \
    do {                                              \
        if (!(condition)) {                           \
            fail(__LINE__, "not so: %s", #condition); \
        }                                             \
    } while (0)

typedef struct key {
    unsigned char bytes[TREEHFS_KEY_BYTES];
    uint32_t size;
} key;

static key key_of(uint32_t tree, const char* text) {
    key parsed;
    WANT_STATUS(treehfs_key_parse(tree, text, parsed.bytes, sizeof parsed.bytes, &parsed.size),
                TREEHFS_OK);
    return parsed;
}

static treehfs_volume* open_with(const char* path, uint32_t access) {
    treehfs_open_options options = TREEHFS_INIT(treehfs_open_options);
    treehfs_volume* volume = NULL;
    options.access = access;
    WANT_STATUS(treehfs_open(path, &options, &volume), TREEHFS_OK);
    return volume;
}

/* Keys of the root folder, one after the other, each followed by a blank. */
static void list_root(treehfs_volume* volume, char* list, size_t capacity) {
    const key root = key_of(TREEHFS_CATALOG, "2:\"\"");
    treehfs_record record = TREEHFS_INIT(treehfs_record);
    treehfs_cursor* cursor = NULL;
    int status;
    list[0] = 0;
    WANT_STATUS(treehfs_cursor_open(volume, TREEHFS_CATALOG, root.bytes, root.size, &cursor),
                TREEHFS_OK);
    while ((status = treehfs_cursor_next(cursor, &record)) == TREEHFS_OK && record.id == 2) {
        const size_t used = strlen(list);
        uint32_t size;
        WANT_STATUS(treehfs_key_text(TREEHFS_CATALOG, record.key, record.key_size, list + used,
                                     (uint32_t)(capacity - used - 1), &size),
                    TREEHFS_OK);
        strcat(list, " ");
    }
    WANT(status == TREEHFS_OK || status == TREEHFS_ERR_NOT_FOUND);
    treehfs_cursor_close(cursor);
}

static int count_finding(void* self, const treehfs_finding* finding) {
    WANT(finding->id != NULL && finding->text != NULL && finding->where != NULL);
    *(int*)self += 1;
    return 0;
}

static void want_sound(treehfs_volume* volume) {
    treehfs_check_options options = TREEHFS_INIT(treehfs_check_options);
    treehfs_check_summary summary = TREEHFS_INIT(treehfs_check_summary);
    int told = 0;
    options.flags = TREEHFS_CHECK_FULL;
    WANT_STATUS(treehfs_check(volume, &options, count_finding, &told, &summary), TREEHFS_OK);
    WANT(summary.errors == 0 && summary.warnings == 0 && summary.unreadable == 0);
    WANT(summary.nodes > 0 && summary.stopped == 0);
    WANT(told == (int)(summary.errors + summary.warnings + summary.infos));
}

static void test_texts(void) {
    WANT_TEXT(treehfs_status_name(TREEHFS_OK), "ok");
    WANT_TEXT(treehfs_status_name(TREEHFS_ERR_NOT_FOUND), "not-found");
    WANT_TEXT(treehfs_status_name(TREEHFS_ERR_BUFFER), "small-buffer");
    WANT_TEXT(treehfs_status_name(12345), "status");
    WANT_TEXT(treehfs_status_text(TREEHFS_ERR_EXISTS), "the key is there already");
    WANT(strchr(treehfs_version(), '.') != NULL);
}

static void test_keys(void) {
    static const unsigned char alpha[] = {0, 10, 0, 0, 0, 2, 0, 2, 0, 'a', 0, 'b'};
    const key parsed = key_of(TREEHFS_CATALOG, "2:\"ab\"");
    unsigned char small[4];
    char text[32];
    uint32_t size = 0;
    WANT(parsed.size == sizeof alpha && memcmp(parsed.bytes, alpha, sizeof alpha) == 0);
    WANT_STATUS(treehfs_key_text(TREEHFS_CATALOG, alpha, sizeof alpha, text, sizeof text, &size),
                TREEHFS_OK);
    WANT_TEXT(text, "2:\"ab\"");
    WANT(size == 6);
    WANT_STATUS(treehfs_key_text(TREEHFS_CATALOG, alpha, sizeof alpha, text, 6, &size),
                TREEHFS_ERR_BUFFER);
    WANT(size == 6);
    WANT_STATUS(treehfs_key_parse(TREEHFS_CATALOG, "2:x", small, sizeof small, &size),
                TREEHFS_ERR_BUFFER);
    WANT(size == 10);
    WANT_STATUS(treehfs_key_parse(TREEHFS_CATALOG, "nonsense", small, sizeof small, &size),
                TREEHFS_ERR_INVALID);
    WANT_TEXT(treehfs_last_error(), "key 'nonsense': expected PARENT:NAME, for example 2:alpha");
    WANT_STATUS(treehfs_key_parse(5, "2:x", small, sizeof small, &size), TREEHFS_ERR_INVALID);
    WANT_STATUS(treehfs_data_parse(TREEHFS_ATTRIBUTES, "@/etc/hostname", small, 4, &size),
                TREEHFS_ERR_INVALID);
}

static void test_misuse(const char* path) {
    treehfs_volume* volume = NULL;
    treehfs_open_options sizeless;
    treehfs_record record = TREEHFS_INIT(treehfs_record);
    treehfs_cursor* cursor = NULL;
    memset(&sizeless, 0, sizeof sizeless);
    WANT_STATUS(treehfs_open(NULL, NULL, &volume), TREEHFS_ERR_INVALID);
    WANT_STATUS(treehfs_open(path, &sizeless, &volume), TREEHFS_ERR_INVALID);
    WANT_STATUS(treehfs_open("/nowhere/at all", NULL, &volume), TREEHFS_ERR_OPEN);
    WANT(volume == NULL && strstr(treehfs_last_error(), "/nowhere/at all") != NULL);
    WANT_STATUS(treehfs_cursor_next(NULL, &record), TREEHFS_ERR_INVALID);
    WANT_STATUS(treehfs_commit(NULL), TREEHFS_ERR_INVALID);
    WANT_STATUS(treehfs_close(NULL), TREEHFS_OK);
    treehfs_cursor_close(NULL);

    volume = open_with(path, TREEHFS_READ);
    WANT_STATUS(treehfs_insert(volume, TREEHFS_CATALOG, "short", 5, "", 0), TREEHFS_ERR_INVALID);
    WANT_STATUS(treehfs_delete(volume, TREEHFS_CATALOG, key_of(TREEHFS_CATALOG, "2:x").bytes, 10),
                TREEHFS_ERR_READ_ONLY);
    WANT_STATUS(treehfs_begin(volume), TREEHFS_ERR_READ_ONLY);
    WANT_STATUS(treehfs_cursor_open(volume, TREEHFS_CATALOG, NULL, 0, &cursor), TREEHFS_OK);
    WANT_STATUS(treehfs_cursor_next(cursor, &record), TREEHFS_OK);
    record.struct_size = 0;
    WANT_STATUS(treehfs_cursor_next(cursor, &record), TREEHFS_ERR_INVALID);
    WANT_STATUS(treehfs_close(volume), TREEHFS_OK);
    record.struct_size = sizeof record;
    WANT_STATUS(treehfs_cursor_next(cursor, &record), TREEHFS_ERR_CLOSED);
    treehfs_cursor_close(cursor);
}

/* A program that was compiled when the struct was shorter gets the members that it knows. */
static void test_old_struct(treehfs_volume* volume) {
    treehfs_tree_info info;
    memset(&info, 0x55, sizeof info);
    info.struct_size = 8;
    WANT_STATUS(treehfs_get_tree_info(volume, TREEHFS_CATALOG, &info), TREEHFS_OK);
    WANT(info.struct_size == 8 && info.node_size >= 512 && info.depth == 0x55555555u);
}

static void test_changes(const char* path) {
    const key note = key_of(TREEHFS_ATTRIBUTES, "2:\"note\"");
    treehfs_volume* volume = open_with(path, TREEHFS_WRITE);
    treehfs_tree_info info = TREEHFS_INIT(treehfs_tree_info);
    unsigned char data[64];
    uint32_t size = 0;
    uint32_t records;
    char json[512];

    test_old_struct(volume);
    WANT_STATUS(treehfs_get_tree_info(volume, TREEHFS_ATTRIBUTES, &info), TREEHFS_OK);
    records = info.leaf_records;
    WANT_STATUS(
        treehfs_data_parse(TREEHFS_ATTRIBUTES, "inline{\"hello!\"}", data, sizeof data, &size),
        TREEHFS_OK);
    WANT(size == 22 && data[3] == 0x10 && data[15] == 6 && memcmp(data + 16, "hello!", 6) == 0);

    WANT_STATUS(treehfs_begin(volume), TREEHFS_OK);
    WANT_STATUS(treehfs_begin(volume), TREEHFS_ERR_INVALID);
    WANT_STATUS(treehfs_insert(volume, TREEHFS_ATTRIBUTES, note.bytes, note.size, data, size),
                TREEHFS_OK);
    WANT_STATUS(treehfs_insert(volume, TREEHFS_ATTRIBUTES, note.bytes, note.size, data, size),
                TREEHFS_ERR_EXISTS);
    WANT_STATUS(treehfs_check(volume, NULL, NULL, NULL, NULL), TREEHFS_ERR_INVALID);
    WANT_STATUS(treehfs_rollback(volume), TREEHFS_OK);
    WANT_STATUS(treehfs_find(volume, TREEHFS_ATTRIBUTES, note.bytes, note.size, NULL, 0, &size),
                TREEHFS_ERR_NOT_FOUND);

    WANT_STATUS(treehfs_insert(volume, TREEHFS_ATTRIBUTES, note.bytes, note.size, data, 22),
                TREEHFS_OK);
    WANT_STATUS(treehfs_commit(volume), TREEHFS_OK);
    WANT_STATUS(treehfs_close(volume), TREEHFS_OK);

    volume = open_with(path, TREEHFS_WRITE);
    memset(data, 0, sizeof data);
    WANT_STATUS(treehfs_find(volume, TREEHFS_ATTRIBUTES, note.bytes, note.size, data, 21, &size),
                TREEHFS_ERR_BUFFER);
    WANT(size == 22);
    WANT_STATUS(
        treehfs_find(volume, TREEHFS_ATTRIBUTES, note.bytes, note.size, data, sizeof data, &size),
        TREEHFS_OK);
    WANT(size == 22 && memcmp(data + 16, "hello!", 6) == 0);
    WANT_STATUS(treehfs_record_json(TREEHFS_ATTRIBUTES, note.bytes, note.size, data, size, json,
                                    sizeof json, &size),
                TREEHFS_OK);
    WANT_TEXT(json,
              "{\"key\":{\"file\":2,\"name\":\"note\"},\"type\":\"inline\",\"size\":6,\"text\":"
              "\"hello!\","
              "\"raw\":\"0000001000000000000000000000000668656c6c6f21\"}");
    want_sound(volume);

    data[15] = 2;
    WANT_STATUS(treehfs_update(volume, TREEHFS_ATTRIBUTES, note.bytes, note.size, data, 18),
                TREEHFS_OK);
    WANT_STATUS(treehfs_commit(volume), TREEHFS_OK);
    WANT_STATUS(
        treehfs_find(volume, TREEHFS_ATTRIBUTES, note.bytes, note.size, data, sizeof data, &size),
        TREEHFS_OK);
    WANT(size == 18);
    WANT_STATUS(treehfs_delete(volume, TREEHFS_ATTRIBUTES, note.bytes, note.size), TREEHFS_OK);
    WANT_STATUS(treehfs_commit(volume), TREEHFS_OK);
    WANT_STATUS(treehfs_get_tree_info(volume, TREEHFS_ATTRIBUTES, &info), TREEHFS_OK);
    WANT(info.leaf_records == records);
    want_sound(volume);
    WANT_STATUS(treehfs_close(volume), TREEHFS_OK);
}

/* Records come and go under a cursor, and the walk goes on behind the last one. */
static void test_cursor_over_changes(const char* path) {
    treehfs_volume* volume = open_with(path, TREEHFS_OVERLAY);
    treehfs_record record = TREEHFS_INIT(treehfs_record);
    treehfs_cursor* cursor = NULL;
    const key first = key_of(TREEHFS_ATTRIBUTES, "3000000000:\"a\"");
    const key second = key_of(TREEHFS_ATTRIBUTES, "3000000000:\"b\"");
    const key third = key_of(TREEHFS_ATTRIBUTES, "3000000000:\"c\"");
    static const unsigned char data[18] = {0, 0, 0, 0x10, [15] = 2, [16] = 'x', [17] = 'y'};
    WANT_STATUS(treehfs_insert(volume, TREEHFS_ATTRIBUTES, first.bytes, first.size, data, 18),
                TREEHFS_OK);
    WANT_STATUS(treehfs_insert(volume, TREEHFS_ATTRIBUTES, third.bytes, third.size, data, 18),
                TREEHFS_OK);
    WANT_STATUS(treehfs_commit(volume), TREEHFS_OK);
    WANT_STATUS(treehfs_cursor_open(volume, TREEHFS_ATTRIBUTES, first.bytes, first.size, &cursor),
                TREEHFS_OK);
    WANT_STATUS(treehfs_cursor_next(cursor, &record), TREEHFS_OK);
    WANT(record.key_size == first.size && memcmp(record.key, first.bytes, first.size) == 0);
    WANT_STATUS(treehfs_delete(volume, TREEHFS_ATTRIBUTES, first.bytes, first.size), TREEHFS_OK);
    WANT_STATUS(treehfs_insert(volume, TREEHFS_ATTRIBUTES, second.bytes, second.size, data, 18),
                TREEHFS_OK);
    WANT_STATUS(treehfs_cursor_next(cursor, &record), TREEHFS_OK);
    WANT(record.key_size == second.size && memcmp(record.key, second.bytes, second.size) == 0);
    WANT(record.data_size == 18 && memcmp(record.data, data, 18) == 0);
    WANT_STATUS(treehfs_rollback(volume), TREEHFS_OK);
    WANT_STATUS(treehfs_cursor_next(cursor, &record), TREEHFS_OK);
    WANT(record.key_size == third.size && memcmp(record.key, third.bytes, third.size) == 0);
    WANT_STATUS(treehfs_cursor_next(cursor, &record), TREEHFS_ERR_NOT_FOUND);
    treehfs_cursor_close(cursor);
    WANT_STATUS(treehfs_close(volume), TREEHFS_OK);
}

int main(int argc, char** argv) {
    treehfs_volume_info info = TREEHFS_INIT(treehfs_volume_info);
    treehfs_volume* volume;
    char list[1024];
    if (argc != 2) {
        printf("usage: c_test IMAGE\n");
        return 2;
    }
    test_texts();
    test_keys();
    test_misuse(argv[1]);
    volume = open_with(argv[1], TREEHFS_READ);
    WANT_STATUS(treehfs_get_volume_info(volume, &info), TREEHFS_OK);
    WANT(info.block_size >= 512 && info.total_blocks > 0 && info.create_date != 0);
    WANT((info.flags & TREEHFS_VOLUME_WRITABLE) == 0 && treehfs_note(volume, 0) == NULL);
    list_root(volume, list, sizeof list);
    WANT_TEXT(list, "2:\"\" 2:\"letters\" 2:\"readme\" ");
    want_sound(volume);
    WANT_STATUS(treehfs_close(volume), TREEHFS_OK);
    test_changes(argv[1]);
    test_cursor_over_changes(argv[1]);
    printf("%d failures\n", failures);
    return failures == 0 ? 0 : 1;
}
