// Compiled buffers, and the plainest walks through them, for comparison with decisions.
#ifndef QZ_BENCH_PLAIN_WALKS_H
#define QZ_BENCH_PLAIN_WALKS_H

#include "qz/acl.h"
#include "qzacl_acl/buffer_format.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

namespace measured {

namespace format = qz::format;

[[noreturn]] inline void give_up(const std::string &what) {
    std::fprintf(stderr, "service_bench: %s\n", what.c_str());
    std::exit(EXIT_FAILURE);
}

inline void require(bool holds, const std::string &what) {
    if (!holds)
        give_up(what);
}

template <class Number>
Number load(const unsigned char *at) {
    Number value;
    std::memcpy(&value, at, sizeof value);
    return value;
}

inline const unsigned char *behind(const unsigned char *entry) {
    return entry + format::entry_fixed_size + load<std::uint16_t>(entry + format::entry_length_offset);
}

inline const char *identity_of(const unsigned char *entry) {
    return reinterpret_cast<const char *>(entry + format::entry_fixed_size);
}

// The compiled form of a file with entries of one key.
class compiled {
public:
    explicit compiled(const std::string &path) {
        require(sec_read_acl_file(path.c_str(), nullptr, nullptr, SEC_READ_ACL_TEXT, &acl, nullptr) ==
                    SEC_S_OK,
                "cannot read " + path);
        qz::byte_reader reader(format::bytes_of(acl));
        format::header header;
        format::subacl head;
        require(format::read(reader, header) && format::read(reader, head), path + " is empty");
        first = reader.position();
        count = head.entry_count;
    }
    compiled(const compiled &) = delete;
    compiled &operator=(const compiled &) = delete;
    ~compiled() { sec_release_acl(&acl); }

    const unsigned char *entry(std::uint32_t number) const {
        const unsigned char *at = first;
        for (; number != 0; --number)
            at = behind(at);
        return at;
    }

    sec_acl_buffer_t acl = {};
    const unsigned char *first = nullptr;
    std::uint32_t count = 0;
};

// An identity as a requester may spell it: the same in the other letter case.
inline std::string respelled(const unsigned char *entry) {
    std::string text = identity_of(entry);
    std::transform(text.begin(), text.end(), text.begin(), [](unsigned char c) {
        return static_cast<char>(std::islower(c) != 0 ? std::toupper(c) : std::tolower(c));
    });
    return text;
}

inline constexpr std::array<unsigned char, 256> fold_table = [] {
    std::array<unsigned char, 256> table{};
    for (unsigned byte = 0; byte < table.size(); ++byte)
        table[byte] = static_cast<unsigned char>(byte >= 'A' && byte <= 'Z' ? byte + ('a' - 'A') : byte);
    return table;
}();

inline int compare_by_table(const char *a, const char *b) {
    for (;; ++a, ++b) {
        const int left = fold_table[static_cast<unsigned char>(*a)];
        const int right = fold_table[static_cast<unsigned char>(*b)];
        if (left != right || left == 0)
            return left - right;
    }
}

// The permissions of the identity, found by comparing one entry after the other, without checking bounds.
template <class Compare>
std::uint32_t scan(const unsigned char *entry, std::uint32_t count, const char *wanted, Compare compare) {
    for (; count != 0; --count, entry = behind(entry)) {
        const int order = compare(wanted, identity_of(entry));
        if (order == 0)
            return load<std::uint32_t>(entry + format::entry_mask_offset);
        if (order < 0)
            break;
    }
    return 0;
}

} // namespace measured

#endif
