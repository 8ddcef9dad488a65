// What the tests of the operations that services call share: a buffer that is freed, lists as values, errors
// whatever the line that recorded them, and the order of identities written down once more.
#ifndef QZ_TESTS_SERVICE_SUPPORT_H
#define QZ_TESTS_SERVICE_SUPPORT_H

#include "support.h"

#include <algorithm>
#include <cstdlib>
#include <iterator>
#include <random>
#include <sstream>

namespace support {

inline const std::string source = "security/ACL/lib/qzacl_acl";

// The error that an operation recorded beside its result, with LINE for the number of the line that a located
// message ends with.
inline failure after(int result) {
    failure found = recorded_error();
    EXPECT_EQ(result, found.code);
    if (const std::size_t at = found.text.rfind(source + ":"); at != std::string::npos)
        found.text.replace(at + source.size() + 1, found.text.size() - at - source.size() - 3, "LINE");
    return found;
}
// A located message: its arguments without the two of the place.
inline failure located(int code, int id, arguments args = {}) {
    args.insert(args.end(), {source, "LINE"});
    return error_of(code, id, args);
}
inline failure bad_parameter(const std::string &function, int position, const std::string &value = "0") {
    return error_of(SEC_S_BAD_PARAMETER, 88, {function, std::to_string(position), value});
}
inline const failure no_error;

// A buffer as the library holds one: its bytes in a block of malloc of exactly their number.
struct buffer {
    explicit buffer(const std::string &bytes = "") {
        if (const std::size_t size = bytes.size(); size != 0)
            acl = {static_cast<std::int32_t>(size), std::memcpy(std::malloc(size), bytes.data(), size)};
    }
    buffer(buffer &&) = delete;
    ~buffer() { std::free(acl.data); }
    std::string bytes() const { return {static_cast<char *>(acl.data), static_cast<std::size_t>(acl.length)}; }
    sec_acl_buffer_t acl = {};
};

struct listed {
    int type;
    std::string mechanism;
    std::string identity; // "<none>" where there is none
    std::uint32_t mask;
    bool operator==(const listed &) const = default;
};

// The entries of a list, which is released.
inline std::vector<listed> taken(sec_aclelist_t &list) {
    std::vector<listed> entries;
    for (std::int32_t at = 0; at < list.count; ++at) {
        const sec_acle_t &acle = *list.acles[at];
        entries.push_back(
            {acle.type, acle.mechanism, acle.identity == nullptr ? "<none>" : acle.identity, acle.perm_mask});
    }
    sec_release_aclelist(&list);
    return entries;
}

// A string field: the text and its NUL. Then an entry and a sub-ACL made of texts.
inline std::string text_field(std::string_view text) { return std::string(text) + '\0'; }
inline std::string named(std::uint32_t mask, std::string_view name) { return packed_entry(mask, text_field(name)); }
inline std::string of_mechanism(int type, std::string_view name, std::uint64_t count, const std::string &entries) {
    return packed_subacl(type, text_field(name), count, entries);
}
inline std::string one(const std::string &subacl) { return packed_acl(1, subacl); }

inline arguments words(const std::string &text) {
    std::istringstream stream(text);
    return {std::istream_iterator<std::string>(stream), {}};
}

// Letters fold, all other bytes count as they are. std::string compares bytes as unsigned.
inline std::string folded(std::string text) {
    for (char &c : text) c = c >= 'A' && c <= 'Z' ? static_cast<char>(c + 32) : c;
    return text;
}
inline bool same(const std::string &a, const std::string &b) { return folded(a) == folded(b); }
inline bool precedes(const std::string &a, const std::string &b) { return folded(a) < folded(b); }

// The 31 bytes that the format is explained with.
inline const std::string example = one(of_mechanism(4, "abcd", 1, named(3, "xyz")));

// One sub-ACL of every type, and a second mechanism; user and group entries in order.
inline const std::string rich = packed_acl(
    6, packed_subacl(16, "", 2, named(0x11, "Admins") + named(0x12, "staff")) +
           of_mechanism(4, "unix", 2, named(1, "al") + named(2, "bob@host.example")) +
           of_mechanism(8, "kRb5", 2, named(4, "z") + named(5, "a")) + of_mechanism(4, "hba2", 1, named(6, "x")) +
           packed_subacl(2, "", 1, packed_entry(7, "")) + packed_subacl(1, "", 1, packed_entry(8, "")));

} // namespace support

#endif
