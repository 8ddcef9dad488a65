// Reading an ACL file as a compiled buffer: from its cache when that is current, else from its text.
#include "owned.h"
#include "qzacl_acl/cache_file.h"
#include "qzacl_acl/compile.h"
#include "qzacl_acl/entry_parser.h"
#include "qzacl_acl/file_name.h"
#include "qzacl_acl/trees.h"
#include "qzacl_trace.h"
#include "qzacl_utils.h"
#include "report.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/stat.h>

namespace {

constexpr mode_t permission_bits = 07777;

// One call's work: from the arguments to the buffer and the flags that the caller gets.
class acl_file_reader {
public:
    acl_file_reader(const char *username, const sec_perm_set_t *set, std::uint32_t flags)
        : username_(username), set_(set), flags_(flags),
          perf_level_(qz::trace_level(qz::trace_category::perf)),
          start_(perf_level_ == 1 ? qz::read_counter() : 0) {}

    int read(const char *aclfname, sec_acl_buffer_t &out);

    std::uint32_t flags() const { return flags_; }
    std::uint32_t line() const { return line_; }

private:
    int vet(const char *aclfname);
    bool cache_is_current();
    bool read_cache(sec_acl_buffer_t &out);
    int open_and_read(const qz::vetted_file &file, qz::file_bytes &bytes) const;
    int read_text(sec_acl_buffer_t &out);
    int parse(qz::file_bytes &text, sec_acl_buffer_t &out);
    int parse_lines(qz::file_bytes &text, sec_acltree_array &trees);
    bool reads_text() const { return (flags_ & SEC_READ_ACL_TEXT) != 0; }

    const char *username_;
    const sec_perm_set_t *set_;
    std::uint32_t flags_;
    std::uint32_t line_ = 1;
    unsigned perf_level_;
    std::uint64_t start_;
    qz::vetted_file acl_;
    qz::vetted_file cache_;
};

int acl_file_reader::vet(const char *aclfname) {
    std::uint32_t user_id = 0;
    if (const int result = sec__get_aclfname(aclfname, username_, acl_.path, &user_id); result != SEC_S_OK)
        return result;
    errno = 0;
    if (stat(acl_.path.text, &acl_.status) != 0 || !S_ISREG(acl_.status.st_mode))
        return qz::report(SEC_S_FILE_ERROR, qz::msg::bad_file_name, acl_.path.text, errno);
    if (acl_.status.st_size == 0 || username_ == nullptr)
        return SEC_S_OK;
    if (acl_.status.st_uid != user_id || (acl_.status.st_mode & (S_IWGRP | S_IWOTH)) != 0)
        return qz::report(SEC_S_BAD_PERMISSION, qz::msg::file_not_private, acl_.path.text, username_);
    return SEC_S_OK;
}

// True when the cache may be read instead of the text: there, later than the text, owned and protected alike.
bool acl_file_reader::cache_is_current() {
    const bool is_traced = qz::traces(qz::trace_category::info);
    if (!qz::make_cache_name(acl_.path.text, cache_.path))
        return false;
    if (is_traced)
        qz::trace_data(117, qz::item(cache_.path.text));
    if (stat(cache_.path.text, &cache_.status) != 0) {
        const int error = errno;
        if (is_traced)
            qz::trace_data(118, qz::item(cache_.path.text), qz::number(error));
        return false;
    }
    if (cache_.status.st_size == 0 || cache_.status.st_mtime <= acl_.status.st_mtime) {
        if (is_traced)
            qz::trace_data(119, qz::item(cache_.path.text));
        return false;
    }
    if (cache_.status.st_uid != acl_.status.st_uid || cache_.status.st_gid != acl_.status.st_gid ||
        (cache_.status.st_mode & permission_bits) != (acl_.status.st_mode & permission_bits)) {
        if (is_traced)
            qz::trace_data(120, qz::item(acl_.path.text), qz::number(acl_.status.st_uid),
                           qz::number(acl_.status.st_gid), qz::number(cache_.status.st_uid),
                           qz::number(cache_.status.st_gid), qz::number(acl_.status.st_mode),
                           qz::number(cache_.status.st_mode));
        return false;
    }
    return true;
}

int acl_file_reader::open_and_read(const qz::vetted_file &file, qz::file_bytes &bytes) const {
    const char *path = file.path.text;
    if (qz::traces(qz::trace_category::info))
        qz::trace_data(121, qz::item(path));
    const std::uint64_t start = perf_level_ == 1 || perf_level_ == 2 ? qz::read_counter() : 0;
    qz::descriptor opened = qz::open_vetted(path, O_RDONLY, file.status);
    if (!opened) {
        const int error = errno;
        if (qz::traces(qz::trace_category::info))
            qz::trace_data(122, qz::item(path), qz::number(error));
        return qz::report(SEC_S_FILE_ERROR, qz::msg::cannot_open_file, path, error);
    }
    if (perf_level_ == 2)
        qz::trace_elapsed(4, start, qz::item(path));
    const int result = qz::lock_and_read(path, opened, bytes);
    opened.close();
    if (perf_level_ == 1)
        qz::trace_elapsed(2, start, qz::item(path));
    return result;
}

// Takes the buffer from the cache. False, with nothing recorded, when anything about it is wrong.
bool acl_file_reader::read_cache(sec_acl_buffer_t &out) {
    qz::file_bytes bytes;
    int result = open_and_read(cache_, bytes);
    if (result == SEC_S_OK && (bytes.length == 0 || bytes.length > INT32_MAX))
        return false;
    if (result == SEC_S_OK && (flags_ & SEC_READ_ACL_CONVERT) != 0) {
        sec_acl_buffer_t candidate = {static_cast<std::int32_t>(bytes.length), bytes.data.get()};
        result = sec_convert_acl_to_host(1, &candidate);
    }
    if (result != SEC_S_OK) {
        cu_set_no_error_1();
        return false;
    }
    out = {static_cast<std::int32_t>(bytes.length), bytes.data.release()};
    return true;
}

int acl_file_reader::parse_lines(qz::file_bytes &text, sec_acltree_array &trees) {
    constexpr int line_consumed = 1;
    constexpr unsigned every_entry = 7; // the Info level above which each line is traced
    const bool traces_lines = qz::trace_level(qz::trace_category::info) > every_entry;
    const bool may_wait = !traces_lines && perf_level_ != 1; // traces show the line of the failure
    char *cursor = text.data.get();
    std::size_t remaining = text.length + 1;
    qz::parsed_acle entry;
    for (;;) {
        const int result = sec__read_acle_from_text(set_, &cursor, &remaining, &line_, &entry);
        if (result != line_consumed)
            return trees.settle(result);
        if (traces_lines) {
            const std::uint32_t type = entry.type;
            const qz::acle_view shown = qz::view_of(entry);
            qz::trace_data(114, qz::number(line_), qz::number(type), qz::item(shown.mechanism),
                           qz::item(shown.identity), qz::number(entry.perm_mask));
        }
        if (entry.type == 0)
            continue;
        const qz::acle_view acle = qz::view_of(entry);
        if (const int added = may_wait ? trees.add_soon(acle) : trees.add(acle); added != SEC_S_OK)
            return added;
    }
}

int acl_file_reader::parse(qz::file_bytes &text, sec_acl_buffer_t &out) {
    const std::uint64_t start = perf_level_ == 1 ? qz::read_counter() : 0;
    flags_ &= ~std::uint32_t{SEC_READ_ACL_CONVERT};
    sec_acltree_array trees(text.all());
    int result = parse_lines(text, trees);
    if (result == SEC_S_OK && !trees.trees().empty())
        result = sec__acltrees_to_acl(trees.trees(), &out);
    if (perf_level_ == 1)
        qz::trace_elapsed(3, start, qz::item(acl_.path.text), qz::number(line_));
    return result;
}

int acl_file_reader::read_text(sec_acl_buffer_t &out) {
    const qz::text_origin origin(acl_.status);
    qz::file_bytes text;
    if (const int result = open_and_read(acl_, text); result != SEC_S_OK)
        return result;
    if (const int result = parse(text, out); result != SEC_S_OK)
        return result;
    if ((flags_ & SEC_READ_ACL_CACHE) != 0 &&
        sec__cache_aclbuffer(acl_.path.text, &out, 0, origin) != SEC_S_OK) {
        // A cache that cannot be written is no failure of the read.
        cu_set_no_error_1();
        flags_ &= ~std::uint32_t{SEC_READ_ACL_CACHE};
    }
    return SEC_S_OK;
}

int acl_file_reader::read(const char *aclfname, sec_acl_buffer_t &out) {
    if (const int result = vet(aclfname); result != SEC_S_OK)
        return result;
    if (acl_.status.st_size == 0) {
        if (qz::traces(qz::trace_category::info))
            qz::trace_data(116, qz::item(acl_.path.text));
        flags_ &= ~std::uint32_t{SEC_READ_ACL_CACHE};
        return SEC_S_OK;
    }
    if (!reads_text() && !cache_is_current())
        flags_ |= SEC_READ_ACL_TEXT;
    if (perf_level_ == 1)
        qz::trace_elapsed(1, start_, qz::item(reads_text() ? acl_.path.text : cache_.path.text));
    if (!reads_text()) {
        if (read_cache(out)) {
            flags_ &= ~std::uint32_t{SEC_READ_ACL_CACHE};
            return SEC_S_OK;
        }
        flags_ |= SEC_READ_ACL_TEXT;
    }
    return read_text(out);
}

} // namespace

int sec_read_acl_file(const char *aclfname, const char *username, const sec_perm_set_t *set,
                      std::uint32_t flags, sec_acl_buffer_t *acl, std::uint32_t *out_flags) {
    constexpr const char *function = "sec_read_acl_file";
    qz::trace_entry(9, [&] {
        qz::trace_data(11, qz::item(aclfname), qz::item(username), qz::number(set), qz::number(flags),
                       qz::number(acl));
    });
    cu_set_no_error_1();
    if (acl != nullptr)
        *acl = {};
    acl_file_reader reader(username, set, flags);
    int result = SEC_S_OK;
    if (aclfname == nullptr)
        result = qz::report_bad_parameter(function, 1, 0);
    else if (acl == nullptr)
        result = qz::report_bad_parameter(function, 5, 0);
    else if (username != nullptr && *username == '\0')
        result = qz::report(SEC_S_BAD_PARAMETER, qz::msg::bad_user_name);
    else
        result = reader.read(aclfname, *acl);
    if (out_flags != nullptr)
        *out_flags = reader.flags();
    qz::trace_exit(12, result, [&] {
        const std::uint32_t line = reader.line();
        qz::trace_data(14, qz::number(result), qz::number(line));
    });
    return result;
}
