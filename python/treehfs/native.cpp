// The module treehfs._native: the C interface as Python calls. What a person uses is the package
// around it (__init__.py).
#include <pybind11/pybind11.h>
#include <treehfs/treehfs.h>

#include <string>
#include <vector>

namespace py = pybind11;

namespace {

// Raises treehfs.Error, or treehfs.NotFound, for a status that is no success.
void Want(int status) {
    if (status == TREEHFS_OK) {
        return;
    }
    const char* type = status == TREEHFS_ERR_NOT_FOUND ? "NotFound" : "Error";
    const py::object error = py::module_::import("treehfs._errors").attr(type);
    const py::object text = py::reinterpret_steal<py::object>(PyUnicode_DecodeUTF8(
        treehfs_last_error(),
        static_cast<Py_ssize_t>(std::char_traits<char>::length(treehfs_last_error())), "replace"));
    const py::object value =
        error(text, treehfs_status_name(status), static_cast<unsigned>(status));
    PyErr_SetObject(error.ptr(), value.ptr());
    throw py::error_already_set();
}

template <typename Struct>
Struct Sized() {
    Struct made{};
    made.struct_size = sizeof made;
    return made;
}

py::bytes Bytes(const void* bytes, std::size_t size) {
    return py::bytes(static_cast<const char*>(bytes), size);
}

// UTF-8 in which halves of surrogate pairs may stand.
py::str Text(const char* text, std::size_t size) {
    return py::reinterpret_steal<py::str>(
        PyUnicode_DecodeUTF8(text, static_cast<Py_ssize_t>(size), "surrogatepass"));
}

std::string Utf8(const py::str& text) {
    const py::object bytes = py::reinterpret_steal<py::object>(
        PyUnicode_AsEncodedString(text.ptr(), "utf-8", "surrogatepass"));
    if (!bytes) {
        throw py::error_already_set();
    }
    return static_cast<std::string>(py::reinterpret_borrow<py::bytes>(bytes));
}

// Calls `call(buffer, capacity, &size)` with a buffer that is large enough.
template <typename Call>
std::vector<char> Filled(Call call) {
    std::vector<char> buffer(1024);
    std::uint32_t size = 0;
    int status = call(buffer.data(), static_cast<std::uint32_t>(buffer.size()), &size);
    if (status == TREEHFS_ERR_BUFFER) {
        buffer.resize(std::size_t{size} + 1);
        status = call(buffer.data(), static_cast<std::uint32_t>(buffer.size()), &size);
    }
    Want(status);
    buffer.resize(size);
    return buffer;
}

struct BytesView {
    const char* data;
    std::uint32_t size;

    explicit BytesView(const py::bytes& bytes) {
        char* start = nullptr;
        Py_ssize_t length = 0;
        if (PyBytes_AsStringAndSize(bytes.ptr(), &start, &length) != 0) {
            throw py::error_already_set();
        }
        if (length > 1 << 20) {
            throw py::value_error("more bytes than a record can hold");
        }
        data = start;
        size = static_cast<std::uint32_t>(length);
    }
};

class Cursor {
public:
    explicit Cursor(treehfs_cursor* handle) : handle_(handle) {}
    Cursor(const Cursor&) = delete;
    Cursor& operator=(const Cursor&) = delete;
    ~Cursor() { treehfs_cursor_close(handle_); }

    // (key, data, node, index), or None at the end.
    py::object Next() {
        auto record = Sized<treehfs_record>();
        const int status = treehfs_cursor_next(handle_, &record);
        if (status == TREEHFS_ERR_NOT_FOUND) {
            return py::none();
        }
        Want(status);
        return py::make_tuple(Bytes(record.key, record.key_size),
                              Bytes(record.data, record.data_size), record.node, record.index);
    }

private:
    treehfs_cursor* handle_;
};

int Collect(void* self, const treehfs_finding* finding) {
    py::dict told;
    told["id"] = finding->id;
    told["severity"] = finding->severity;
    told["tree"] = finding->tree;
    told["node"] = finding->node;
    told["record"] = finding->record;
    told["offset"] = finding->offset;
    told["where"] = py::str(finding->where);
    told["text"] = py::str(finding->text);
    static_cast<py::list*>(self)->append(told);
    return 0;
}

class Volume {
public:
    Volume(const py::str& path, std::uint32_t access, const py::object& offset,
           std::uint32_t partition, std::uint32_t flags) {
        auto options = Sized<treehfs_open_options>();
        options.access = access;
        options.partition = partition;
        options.flags = flags;
        if (!offset.is_none()) {
            options.offset = offset.cast<std::uint64_t>();
            options.flags |= TREEHFS_OPEN_AT_OFFSET;
        }
        const py::object name =
            py::reinterpret_steal<py::object>(PyUnicode_EncodeFSDefault(path.ptr()));
        if (!name) {
            throw py::error_already_set();
        }
        const std::string bytes = static_cast<std::string>(py::reinterpret_borrow<py::bytes>(name));
        Want(treehfs_open(bytes.c_str(), &options, &handle_));
    }
    Volume(const Volume&) = delete;
    Volume& operator=(const Volume&) = delete;
    ~Volume() { treehfs_close(handle_); }

    void Close() {
        treehfs_volume* handle = handle_;
        handle_ = nullptr;
        Want(treehfs_close(handle));
    }
    bool IsOpen() const { return handle_ != nullptr; }

    py::dict Info() {
        auto info = Sized<treehfs_volume_info>();
        Want(treehfs_get_volume_info(Open(), &info));
        py::dict out;
        out["flags"] = info.flags;
        out["offset"] = info.offset;
        out["block_size"] = info.block_size;
        out["total_blocks"] = info.total_blocks;
        out["free_blocks"] = info.free_blocks;
        out["file_count"] = info.file_count;
        out["folder_count"] = info.folder_count;
        out["next_id"] = info.next_id;
        out["create_date"] = info.create_date;
        out["modify_date"] = info.modify_date;
        out["backup_date"] = info.backup_date;
        out["checked_date"] = info.checked_date;
        return out;
    }
    py::list Notes() {
        py::list out;
        treehfs_volume* handle = Open();
        for (std::uint32_t i = 0; treehfs_note(handle, i) != nullptr; ++i) {
            out.append(py::str(treehfs_note(handle, i)));
        }
        return out;
    }
    py::dict TreeInfo(std::uint32_t tree) {
        auto info = Sized<treehfs_tree_info>();
        Want(treehfs_get_tree_info(Open(), tree, &info));
        py::dict out;
        out["node_size"] = info.node_size;
        out["depth"] = info.depth;
        out["root_node"] = info.root_node;
        out["first_leaf"] = info.first_leaf;
        out["last_leaf"] = info.last_leaf;
        out["leaf_records"] = info.leaf_records;
        out["total_nodes"] = info.total_nodes;
        out["free_nodes"] = info.free_nodes;
        out["max_key_length"] = info.max_key_length;
        out["attributes"] = info.attributes;
        out["key_compare"] = info.key_compare;
        return out;
    }
    py::bytes Find(std::uint32_t tree, const py::bytes& key) {
        const BytesView view(key);
        treehfs_volume* handle = Open();
        const std::vector<char> data =
            Filled([&](char* buffer, std::uint32_t capacity, std::uint32_t* size) {
                return treehfs_find(handle, tree, view.data, view.size, buffer, capacity, size);
            });
        return Bytes(data.data(), data.size());
    }
    std::unique_ptr<Cursor> Walk(std::uint32_t tree, const py::object& key) {
        treehfs_cursor* cursor = nullptr;
        if (key.is_none()) {
            Want(treehfs_cursor_open(Open(), tree, nullptr, 0, &cursor));
        } else {
            const BytesView view(key.cast<py::bytes>());
            Want(treehfs_cursor_open(Open(), tree, view.data, view.size, &cursor));
        }
        return std::make_unique<Cursor>(cursor);
    }
    void Insert(std::uint32_t tree, const py::bytes& key, const py::bytes& data) {
        const BytesView k(key), d(data);
        Want(treehfs_insert(Open(), tree, k.data, k.size, d.data, d.size));
    }
    void Update(std::uint32_t tree, const py::bytes& key, const py::bytes& data) {
        const BytesView k(key), d(data);
        Want(treehfs_update(Open(), tree, k.data, k.size, d.data, d.size));
    }
    void Delete(std::uint32_t tree, const py::bytes& key) {
        const BytesView k(key);
        Want(treehfs_delete(Open(), tree, k.data, k.size));
    }
    void Begin() { Want(treehfs_begin(Open())); }
    void Commit() { Want(treehfs_commit(Open())); }
    void Rollback() { Want(treehfs_rollback(Open())); }

    // (errors, warnings, infos, unreadable, stopped, nodes, bytes, findings)
    py::tuple Check(std::uint32_t flags, std::uint32_t maxErrors) {
        auto options = Sized<treehfs_check_options>();
        options.flags = flags;
        options.max_errors = maxErrors;
        auto summary = Sized<treehfs_check_summary>();
        py::list findings;
        Want(treehfs_check(Open(), &options, Collect, &findings, &summary));
        return py::make_tuple(summary.errors, summary.warnings, summary.infos, summary.unreadable,
                              summary.stopped != 0, summary.nodes, summary.bytes, findings);
    }

private:
    // The handle of a volume that is open; raises otherwise.
    treehfs_volume* Open() {
        if (handle_ == nullptr) {
            const py::object error = py::module_::import("treehfs._errors").attr("Error");
            const py::object value = error(treehfs_status_text(TREEHFS_ERR_CLOSED),
                                           treehfs_status_name(TREEHFS_ERR_CLOSED),
                                           static_cast<unsigned>(TREEHFS_ERR_CLOSED));
            PyErr_SetObject(error.ptr(), value.ptr());
            throw py::error_already_set();
        }
        return handle_;
    }

    treehfs_volume* handle_ = nullptr;
};

py::bytes KeyParse(std::uint32_t tree, const py::str& text) {
    const std::string utf8 = Utf8(text);
    const auto key = Filled([&](char* buffer, std::uint32_t capacity, std::uint32_t* size) {
        return treehfs_key_parse(tree, utf8.c_str(), buffer, capacity, size);
    });
    return Bytes(key.data(), key.size());
}

py::str KeyText(std::uint32_t tree, const py::bytes& key) {
    const BytesView k(key);
    const auto text = Filled([&](char* buffer, std::uint32_t capacity, std::uint32_t* size) {
        return treehfs_key_text(tree, k.data, k.size, buffer, capacity, size);
    });
    return Text(text.data(), text.size());
}

py::bytes DataParse(std::uint32_t tree, const py::str& text) {
    const std::string utf8 = Utf8(text);
    const auto data = Filled([&](char* buffer, std::uint32_t capacity, std::uint32_t* size) {
        return treehfs_data_parse(tree, utf8.c_str(), buffer, capacity, size);
    });
    return Bytes(data.data(), data.size());
}

py::str RecordJson(std::uint32_t tree, const py::bytes& key, const py::bytes& data) {
    const BytesView k(key), d(data);
    const auto text = Filled([&](char* buffer, std::uint32_t capacity, std::uint32_t* size) {
        return treehfs_record_json(tree, k.data, k.size, d.data, d.size, buffer, capacity, size);
    });
    return Text(text.data(), text.size());
}

}  // namespace

PYBIND11_MODULE(_native, module) {
    py::class_<Cursor>(module, "Cursor").def("next", &Cursor::Next);
    py::class_<Volume>(module, "Volume")
        .def(py::init<const py::str&, std::uint32_t, const py::object&, std::uint32_t,
                      std::uint32_t>())
        .def("close", &Volume::Close)
        .def("is_open", &Volume::IsOpen)
        .def("info", &Volume::Info)
        .def("notes", &Volume::Notes)
        .def("tree_info", &Volume::TreeInfo)
        .def("find", &Volume::Find)
        .def("walk", &Volume::Walk)
        .def("insert", &Volume::Insert)
        .def("update", &Volume::Update)
        .def("delete", &Volume::Delete)
        .def("begin", &Volume::Begin)
        .def("commit", &Volume::Commit)
        .def("rollback", &Volume::Rollback)
        .def("check", &Volume::Check);
    module.def("key_parse", KeyParse);
    module.def("key_text", KeyText);
    module.def("data_parse", DataParse);
    module.def("record_json", RecordJson);
    module.def("version", treehfs_version);
}
