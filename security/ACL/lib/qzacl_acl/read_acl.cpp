// Reading an ACL file into a compiled buffer: from its cache if that is current, else from its text.
#include "base/uncancelled.h"
#include "qzacl_acl/acl_text.h"
#include "qzacl_acl/buffer_format.h"
#include "qzacl_acl/cache_file.h"
#include "qzacl_acl/cache_vetting.h"
#include "qzacl_acl/compile.h"
#include "qzacl_acl/file_name.h"
#include "qzacl_acl/trees.h"
#include "qzacl_acl/validate.h"
#include "qzacl_utils/file_bytes.h"
#include "report.h"
#include "trace_points.h"

using namespace qz;

namespace {

constexpr acl_file_use by_library = {
    .not_found = {SEC_S_FILE_ERROR, msg::bad_file_name},
    .not_private = {SEC_S_BAD_PERMISSION, msg::file_not_private},
    .cannot_open = {SEC_S_FILE_ERROR, msg::cannot_open_file},
    .takes_empty_of_anybody = true,
    .is_traced = true,
};

// Converts the bytes of a cache to host order if necessary, and checks them in either case.
int convert_and_check(sec_acl_buffer_t &acl) {
    const byte_span bytes = format::bytes_of(acl);
    const bool is_foreign =
        bytes.size() > format::order_offset && bytes[format::order_offset] != format::host_order;
    constexpr int with_check = 1;
    if (const int result = sec_convert_acl_to_host(with_check, &acl); result != SEC_S_OK || !is_foreign)
        return result;
    return sec__check_acl_buffer(&acl);
}

// The work of one call, from its arguments to the buffer and the flags returned.
class acl_file_reader {
public:
    acl_file_reader(const char *username, const sec_perm_set_t *set, std::uint32_t flags)
        : username_(username), asked_(flags), flags_(flags), text_(set) {}

    int read(const char *aclfname, sec_acl_buffer_t &out) {
        const choosing_timer choosing;
        return text_.open_again_while_replaced([&] { return read_once(aclfname, choosing, out); });
    }

    std::uint32_t flags() const { return flags_; }
    std::uint32_t line() const { return text_.line(); }

private:
    using choosing_timer = trace_timer<point::choosing_file>;

    int read_once(const char *aclfname, const choosing_timer &choosing, sec_acl_buffer_t &out);
    bool read_cache(sec_acl_buffer_t &out);
    int read_text(sec_acl_buffer_t &out);
    int parse(sec_acl_buffer_t &out);
    int parse_lines(sec_acltree_array &trees);
    bool reads_text() const { return (flags_ & SEC_READ_ACL_TEXT) != 0; }

    const char *username_;
    std::uint32_t asked_;
    std::uint32_t flags_; // of the current attempt
    acl_text text_;
    vetted_file acl_;
    vetted_file cache_;
};

// Takes the buffer from the cache. If anything is wrong with it, records nothing and returns false.
bool acl_file_reader::read_cache(sec_acl_buffer_t &out) {
    file_bytes bytes;
    int result = read_cache_of(acl_, cache_, by_library, bytes);
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
    const bool traces_lines = traces(point::line_read);
    parsed_acle entry;
    for (;;) {
        const acl_line line = text_.next(entry);
        if (line == acl_line::end)
            return trees.settle(SEC_S_OK);
        if (line == acl_line::bad)
            return trees.settle(text_.failure());
        const acle_view acle = view_of(entry);
        if (traces_lines)
            point::line_read.record(text_.line(), entry.type, acle.mechanism, acle.identity, entry.perm_mask);
        if (line == acl_line::none)
            continue;
        if (const int added = trees.add(acle); added != SEC_S_OK)
            return added;
    }
}

int acl_file_reader::parse(sec_acl_buffer_t &out) {
    const trace_timer<point::parsing> parsing;
    flags_ &= ~std::uint32_t{SEC_READ_ACL_CONVERT};
    sec_acltree_array trees(text_.all(), on_duplicate::report_late);
    int result = parse_lines(trees);
    if (result == SEC_S_OK && !trees.trees().empty())
        result = sec__acltrees_to_acl(trees.trees(), &out);
    parsing.stop(acl_.path.text, text_.line());
    return result;
}

int acl_file_reader::read_text(sec_acl_buffer_t &out) {
    if (const int result = text_.open(acl_, by_library); result != SEC_S_OK)
        return result;
    if (const int result = parse(out); result != SEC_S_OK)
        return result;
    if ((flags_ & SEC_READ_ACL_CACHE) != 0 &&
        sec__cache_aclbuffer(acl_.path.text, &out, cache_rewriting::unless_current, text_.origin()) !=
            SEC_S_OK) {
        // Failing to write the cache does not fail the read.
        cu_set_no_error_1();
        flags_ &= ~std::uint32_t{SEC_READ_ACL_CACHE};
    }
    return SEC_S_OK;
}

int acl_file_reader::read_once(const char *aclfname, const choosing_timer &choosing, sec_acl_buffer_t &out) {
    flags_ = asked_;
    if (const int result = vet_acl_file(aclfname, username_, by_library, acl_); result != SEC_S_OK)
        return result;
    if (acl_.status.st_size == 0) {
        trace(point::file_is_empty, acl_.path.text);
        flags_ &= ~std::uint32_t{SEC_READ_ACL_CACHE};
        return SEC_S_OK;
    }
    if (!reads_text() && !cache_is_current(acl_, cache_))
        flags_ |= SEC_READ_ACL_TEXT;
    choosing.stop(reads_text() ? acl_.path.text : cache_.path.text);
    if (!reads_text()) {
        if (read_cache(out)) {
            flags_ &= ~std::uint32_t{SEC_READ_ACL_CACHE};
            return SEC_S_OK;
        }
        flags_ |= SEC_READ_ACL_TEXT;
    }
    return read_text(out);
}

int read_checked(acl_file_reader &reader, const char *aclfname, const char *username, sec_acl_buffer_t *acl) {
    constexpr const char *function = "sec_read_acl_file";
    if (acl != nullptr)
        *acl = {};
    if (aclfname == nullptr)
        return report_bad_parameter(function, 1, 0);
    if (acl == nullptr)
        return report_bad_parameter(function, 5, 0);
    if (username != nullptr && *username == '\0')
        return report(SEC_S_BAD_PARAMETER, msg::bad_user_name);
    return reader.read(aclfname, *acl);
}

} // namespace

int sec_read_acl_file(const char *aclfname, const char *username, const sec_perm_set_t *set,
                      std::uint32_t flags, sec_acl_buffer_t *acl, std::uint32_t *out_flags) {
    const uncancelled until_all_is_closed;
    acl_file_reader reader(username, set, flags);
    return run(
        operation::read_acl_file, std::tie(aclfname, username, set, flags, acl),
        [&] {
            const int result = read_checked(reader, aclfname, username, acl);
            if (out_flags != nullptr)
                *out_flags = reader.flags();
            return result;
        },
        [&] { return std::make_tuple(reader.line()); });
}
