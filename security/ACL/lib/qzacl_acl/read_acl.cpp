// Reading an ACL file as a compiled buffer: from its cache when that is current, else from its text.
#include "base/uncancelled.h"
#include "qzacl_acl/acl_text.h"
#include "qzacl_acl/buffer_format.h"
#include "qzacl_acl/cache_file.h"
#include "qzacl_acl/cache_vetting.h"
#include "qzacl_acl/compile.h"
#include "qzacl_acl/file_name.h"
#include "qzacl_acl/trees.h"
#include "qzacl_acl/validate.h"
#include "qzacl_trace.h"
#include "qzacl_utils.h"
#include "report.h"

namespace {

constexpr qz::acl_file_use by_library = {
    .not_found = {SEC_S_FILE_ERROR, qz::msg::bad_file_name},
    .not_private = {SEC_S_BAD_PERMISSION, qz::msg::file_not_private},
    .cannot_open = {SEC_S_FILE_ERROR, qz::msg::cannot_open_file},
    .takes_empty_of_anybody = true,
    .is_traced = true,
};

// Brings the bytes of a cache into host order and checks them, also those that had to be converted.
int convert_and_check(sec_acl_buffer_t &acl) {
    const qz::byte_span bytes = qz::format::bytes_of(acl);
    const bool is_foreign =
        bytes.size() > qz::format::order_offset && bytes[qz::format::order_offset] != qz::format::host_order;
    if (const int result = sec_convert_acl_to_host(1, &acl); result != SEC_S_OK || !is_foreign)
        return result;
    return sec__check_acl_buffer(&acl);
}

// One call's work: from the arguments to the buffer and the flags that the caller gets.
class acl_file_reader {
public:
    acl_file_reader(const char *username, const sec_perm_set_t *set, std::uint32_t flags)
        : username_(username), asked_(flags), flags_(flags), text_(set),
          perf_level_(qz::trace_level(qz::trace_category::perf)),
          start_(perf_level_ == 1 ? qz::read_counter() : 0) {}

    int read(const char *aclfname, sec_acl_buffer_t &out) {
        return text_.open_again_while_replaced([&] { return read_once(aclfname, out); });
    }

    std::uint32_t flags() const { return flags_; }
    std::uint32_t line() const { return text_.line(); }

private:
    int read_once(const char *aclfname, sec_acl_buffer_t &out);
    bool read_cache(sec_acl_buffer_t &out);
    int read_text(sec_acl_buffer_t &out);
    int parse(sec_acl_buffer_t &out);
    int parse_lines(sec_acltree_array &trees);
    bool reads_text() const { return (flags_ & SEC_READ_ACL_TEXT) != 0; }

    const char *username_;
    std::uint32_t asked_;
    std::uint32_t flags_; // of the attempt at hand
    qz::acl_text text_;
    unsigned perf_level_;
    std::uint64_t start_;
    qz::vetted_file acl_;
    qz::vetted_file cache_;
};

// Takes the buffer from the cache. False, with nothing recorded, when anything about it is wrong.
bool acl_file_reader::read_cache(sec_acl_buffer_t &out) {
    qz::file_bytes bytes;
    int result = qz::read_cache_of(acl_, cache_, by_library, bytes);
    if (result == SEC_S_OK && (bytes.length == 0 || bytes.length > INT32_MAX))
        return false;
    if (result == SEC_S_OK && (flags_ & SEC_READ_ACL_CONVERT) != 0) {
        sec_acl_buffer_t candidate = {static_cast<std::int32_t>(bytes.length), bytes.data.get()};
        result = convert_and_check(candidate);
    }
    if (result != SEC_S_OK) {
        cu_set_no_error_1();
        return false;
    }
    out = {static_cast<std::int32_t>(bytes.length), bytes.data.release()};
    return true;
}

int acl_file_reader::parse_lines(sec_acltree_array &trees) {
    constexpr unsigned every_line = 7; // the Info level above which each line is traced
    const bool traces_lines = qz::trace_level(qz::trace_category::info) > every_line;
    const bool may_wait = !traces_lines && perf_level_ != 1; // traces show the line of the failure
    qz::parsed_acle entry;
    for (;;) {
        const qz::acl_line line = text_.next(entry);
        if (line == qz::acl_line::end)
            return trees.settle(SEC_S_OK);
        if (line == qz::acl_line::bad)
            return trees.settle(text_.failure());
        if (traces_lines) {
            const std::uint32_t number = text_.line();
            const std::uint32_t type = entry.type;
            const qz::acle_view shown = qz::view_of(entry);
            qz::trace_data(114, qz::number(number), qz::number(type), qz::item(shown.mechanism),
                           qz::item(shown.identity), qz::number(entry.perm_mask));
        }
        if (line == qz::acl_line::none)
            continue;
        const qz::acle_view acle = qz::view_of(entry);
        if (const int added = may_wait ? trees.add_soon(acle) : trees.add(acle); added != SEC_S_OK)
            return added;
    }
}

int acl_file_reader::parse(sec_acl_buffer_t &out) {
    const std::uint64_t start = perf_level_ == 1 ? qz::read_counter() : 0;
    flags_ &= ~std::uint32_t{SEC_READ_ACL_CONVERT};
    sec_acltree_array trees(text_.all());
    int result = parse_lines(trees);
    if (result == SEC_S_OK && !trees.trees().empty())
        result = sec__acltrees_to_acl(trees.trees(), &out);
    if (perf_level_ == 1) {
        const std::uint32_t line = text_.line();
        qz::trace_elapsed(3, start, qz::item(acl_.path.text), qz::number(line));
    }
    return result;
}

int acl_file_reader::read_text(sec_acl_buffer_t &out) {
    if (const int result = text_.open(acl_, by_library); result != SEC_S_OK)
        return result;
    if (const int result = parse(out); result != SEC_S_OK)
        return result;
    if ((flags_ & SEC_READ_ACL_CACHE) != 0 &&
        sec__cache_aclbuffer(acl_.path.text, &out, 0, text_.origin()) != SEC_S_OK) {
        // A cache that cannot be written is no failure of the read.
        cu_set_no_error_1();
        flags_ &= ~std::uint32_t{SEC_READ_ACL_CACHE};
    }
    return SEC_S_OK;
}

int acl_file_reader::read_once(const char *aclfname, sec_acl_buffer_t &out) {
    flags_ = asked_;
    if (const int result = qz::vet_acl_file(aclfname, username_, by_library, acl_); result != SEC_S_OK)
        return result;
    if (acl_.status.st_size == 0) {
        if (qz::traces(qz::trace_category::info))
            qz::trace_data(116, qz::item(acl_.path.text));
        flags_ &= ~std::uint32_t{SEC_READ_ACL_CACHE};
        return SEC_S_OK;
    }
    if (!reads_text() && !qz::cache_is_current(acl_, cache_))
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
    const qz::uncancelled until_all_is_closed;
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
