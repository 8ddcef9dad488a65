/*
 * Finds the entry of an answer in the bytes of a compiled ACL: the part of <qz/service.hpp> that knows their
 * format. Nothing here is for callers.
 */
#ifndef QZ_STORED_ENTRY_HPP
#define QZ_STORED_ENTRY_HPP

#include <qz/acl_text.hpp>

namespace qz::detail {

/* Reads bytes in host order from front to back, and nothing outside them. */
class stored_bytes {
public:
    explicit stored_bytes(std::string_view bytes) noexcept : left_(bytes) {}

    [[nodiscard]] bool take(std::size_t count, std::string_view &out) noexcept {
        if (count > left_.size())
            return false;
        out = left_.substr(0, count);
        left_.remove_prefix(count);
        return true;
    }

    template <class Number>
    [[nodiscard]] bool number(Number &out) noexcept {
        std::string_view bytes;
        if (!take(sizeof out, bytes))
            return false;
        std::memcpy(&out, bytes.data(), sizeof out);
        return true;
    }

    /* A field of the given size that holds a string; returned up to its NUL. */
    [[nodiscard]] bool string(std::size_t size, std::string_view &out) noexcept {
        if (!take(size, out))
            return false;
        const std::size_t end = out.find('\0');
        if (end != std::string_view::npos)
            out = out.substr(0, end);
        return size == 0 || end != std::string_view::npos;
    }

private:
    std::string_view left_;
};

/* The header of a sub-ACL, with its mechanism. */
struct stored_subacl {
    std::uint32_t length = 0;
    std::uint8_t type = 0;
    std::uint32_t count = 0;
    std::string_view mechanism;

    [[nodiscard]] bool read(stored_bytes &from) noexcept {
        std::uint8_t size = 0;
        return from.number(length) && from.number(type) && from.number(count) && from.number(size) &&
               from.string(size, mechanism);
    }
};

/* The first entry of a sub-ACL that matches, its type 0 when there is none. */
template <class Matches>
entry_fields find_in_subacl(const stored_subacl &head, stored_bytes from, const Matches &matches) noexcept {
    entry_fields entry = {head.type, 0, head.mechanism, {}};
    for (std::uint32_t left = head.count; left != 0; --left) {
        std::uint8_t version = 0;
        std::uint16_t size = 0;
        if (!from.number(version) || !from.number(entry.permissions) || !from.number(size) ||
            !from.string(size, entry.identity))
            break;
        if (matches(entry))
            return entry;
    }
    return {};
}

/*
 * The first entry that matches in the first sub-ACL of a type and mechanism (empty: the type takes none), as
 * evaluation searches them; its type is 0 when there is none. Its texts point into the bytes.
 */
template <class Matches>
entry_fields find_entry(std::string_view acl, std::uint8_t type, std::string_view mechanism,
                        const Matches &matches) noexcept {
    constexpr std::uint32_t header_size = 10;
    stored_bytes at(acl);
    std::string_view passed;
    std::uint16_t count = 0;
    if (!at.take(3, passed) || !at.number(count))
        return {};
    for (; count != 0; --count) {
        stored_bytes entries = at;
        stored_subacl head;
        if (!head.read(entries))
            break;
        if (head.type == type && same_folded(head.mechanism, mechanism))
            return find_in_subacl(head, entries, matches);
        if (head.length < header_size || !at.take(head.length, passed))
            break;
    }
    return {};
}

} // namespace qz::detail

#endif
