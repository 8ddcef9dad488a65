/*
 * ACLs as texts, and comparing them: part of <qz/service.hpp>, which states the rules.
 */
#ifndef QZ_ACL_TEXT_HPP
#define QZ_ACL_TEXT_HPP

#include <qz/acl.hpp>
#include <qz/memory_file.hpp>

#include <algorithm>
#include <arpa/inet.h>
#include <cctype>
#include <cstdio>
#include <cstring>
#include <new>

namespace qz {

/* ---- Texts ---- */

/* An owned text that grows. Movable; ends with a NUL. */
class text {
public:
    text() noexcept = default;

    [[nodiscard]] std::string_view view() const noexcept { return {c_str(), size_}; }
    [[nodiscard]] const char *c_str() const noexcept { return bytes_ ? bytes_.get() : ""; }

    /* Whether memory ran out in an append; it and all later ones changed nothing. */
    [[nodiscard]] bool failed() const noexcept { return failed_; }

    text &append(std::string_view more) noexcept {
        if (reserve(size_ + more.size() + 1)) {
            size_ += more.copy(bytes_.get() + size_, more.size());
            bytes_.get()[size_] = '\0';
        }
        return *this;
    }

    /* Empties the text and keeps its memory. */
    void clear() noexcept {
        size_ = 0;
        if (bytes_)
            *bytes_ = '\0';
    }

private:
    struct release {
        void operator()(char *bytes) const noexcept { std::free(bytes); }
    };

    bool reserve(std::size_t wanted) noexcept {
        if (failed_ || wanted <= room_)
            return !failed_;
        const std::size_t room = std::max(wanted, room_ * 2);
        char *moved = static_cast<char *>(std::realloc(bytes_.get(), room));
        if (moved == nullptr)
            return failed_ = true, false;
        static_cast<void>(bytes_.release());
        bytes_.reset(moved);
        room_ = room;
        return true;
    }

    std::unique_ptr<char, release> bytes_;
    std::size_t size_ = 0;
    std::size_t room_ = 0;
    bool failed_ = false;
};

namespace detail {

/* A code that these headers return without a recorded error. */
inline int unrecorded(int code) noexcept {
    cu_set_no_error_1();
    return code;
}

constexpr unsigned char fold(char c) noexcept {
    return static_cast<unsigned char>(c >= 'A' && c <= 'Z' ? c + ('a' - 'A') : c);
}

/* Compares names as strcmp does, but ignores the case of A to Z. */
inline int compare_folded(std::string_view a, std::string_view b) noexcept {
    const std::size_t common = std::min(a.size(), b.size());
    for (std::size_t at = 0; at < common; ++at) {
        if (const int order = fold(a[at]) - fold(b[at]); order != 0)
            return order;
    }
    return a.size() == b.size() ? 0 : (a.size() < b.size() ? -1 : 1);
}

inline bool same_folded(std::string_view a, std::string_view b) noexcept {
    return a.size() == b.size() && compare_folded(a, b) == 0;
}

/* Whether a line of an ACL file can hold it as a word. White space is defined as for the reader. */
inline bool is_word(std::string_view word) noexcept {
    const auto is_space = [](char c) { return std::isspace(static_cast<unsigned char>(c)) != 0; };
    return !word.empty() && word.front() != '#' && std::none_of(word.begin(), word.end(), is_space);
}

} // namespace detail

/* ---- Entries as lines ---- */

/* An entry that borrows its texts: UTF-8, empty if the type has none. */
struct entry_fields {
    std::uint8_t type = 0; /* SEC_ACLE_...; 0: no entry */
    std::uint32_t permissions = 0;
    std::string_view mechanism;
    std::string_view identity;
};

/* The letter of a type in ACL files; '?' for an unknown type. */
constexpr char type_letter(std::uint8_t type) noexcept {
    return type <= SEC_ACLE_GROUP ? "?no?u???e???????g"[type] : '?';
}

/*
 * Appends an entry as the words of a line: single blanks, the mechanism in lower case, the identity as stored, the
 * letters in the order of their bits; no line end.
 *
 *   set   null: acl__default_perm_set
 *
 * Codes: those of to_letters, after which nothing was appended; 6.
 */
inline int append_entry(text &line, const entry_fields &entry, const sec_perm_set_t *set = nullptr) noexcept {
    const auto letters = to_letters(entry.permissions, set);
    if (!letters)
        return letters.code();
    const char type = type_letter(entry.type);
    line.append({&type, 1});
    if (!entry.mechanism.empty())
        line.append(" ");
    for (const char each : entry.mechanism) {
        const auto folded = static_cast<char>(detail::fold(each));
        line.append({&folded, 1});
    }
    for (const std::string_view word : {entry.identity, letters->view()}) {
        if (!word.empty())
            line.append(" ").append(word);
    }
    return line.failed() ? detail::unrecorded(SEC_S_NO_MEMORY) : SEC_S_OK;
}

/*
 * Converts an identity as sec_create_acle does for a user, except for the code set: with the mechanism "unix" or
 * "hba2", in any letter case, an IPv6 address after the first '@' gets its canonical form. Identities that
 * sec_create_acle would reject are not changed.
 *
 *   mechanism, identity   UTF-8; null gives identity
 *   kept                  holds the result unless it is identity itself; failed() when memory ran out
 */
inline const char *stored_identity(const char *mechanism, const char *identity, text &kept) noexcept {
    if (mechanism == nullptr || identity == nullptr ||
        !(detail::same_folded(mechanism, "unix") || detail::same_folded(mechanism, "hba2")))
        return identity;
    const char *at = std::strchr(identity, '@');
    in6_addr address = {};
    char formatted[INET6_ADDRSTRLEN] = {};
    if (at == nullptr || inet_pton(AF_INET6, at + 1, &address) != 1 ||
        cu_ipaddr_ntop_1(&address, formatted) != CU_OK)
        return identity;
    const auto user = static_cast<std::size_t>(at + 1 - identity);
    kept.clear();
    return kept.append({identity, user}).append(formatted).c_str();
}

/* ---- ACLs as texts ---- */

namespace detail {

/* Appends an entry as a line of an ACL file. 43 where no line can hold it. */
inline int append_line(text &lines, entry_view entry, const sec_perm_set_t *set) noexcept {
    constexpr std::size_t longest = 1096; /* with its end */
    const auto letters = to_letters(entry.permissions(), set);
    if (!letters)
        return letters.code();
    /* Letters that two permissions share do not lead back to the second one. */
    const auto back = to_mask(letters->c_str(), set);
    const bool grants = entry.permissions() != 0;
    const bool has_mechanism = (entry.type() & (SEC_ACLE_USER | SEC_ACLE_EXPANDED)) != 0;
    const bool has_identity = has_mechanism || entry.type() == SEC_ACLE_GROUP;
    if ((grants && (!is_word(letters->view()) || !back || *back != entry.permissions())) ||
        (has_mechanism && !is_word(entry.mechanism())) || (has_identity && !is_word(entry.identity())))
        return unrecorded(SEC_S_BAD_ACLE);
    const std::size_t before = lines.view().size();
    const int code =
        append_entry(lines, {entry.type(), entry.permissions(), entry.mechanism(), entry.identity()}, set);
    if (code != SEC_S_OK)
        return code;
    lines.append("\n");
    if (lines.view().size() - before > longest)
        return unrecorded(SEC_S_BAD_ACLE);
    return lines.failed() ? unrecorded(SEC_S_NO_MEMORY) : SEC_S_OK;
}

} // namespace detail

/*
 * Writes an ACL as the text of an ACL file: sub-ACLs from last to first and their entries in stored order,
 * which compiles to the same bytes again.
 *
 *   set   null: acl__default_perm_set
 *
 * Codes: those of sec_list_acl and to_letters; 6; 43, not recorded: an entry that no line can hold, because a
 * text of it is empty, has white space or begins with '#', its letters do not lead back to its permissions,
 * or the line would have more than 1096 bytes. After a failure there is no text.
 */
inline result<text> to_text(const acl &acl, const sec_perm_set_t *set = nullptr) noexcept {
    const auto entries = acl.list();
    if (!entries)
        return {entries.code(), text()};
    text lines;
    const auto is_of = [&](std::size_t at, entry_view other) {
        const entry_view entry = (*entries)[at];
        return entry.type() == other.type() && detail::same_folded(entry.mechanism(), other.mechanism());
    };
    for (std::size_t end = entries->size(), begin = end; end != 0; end = begin) {
        const entry_view last = (*entries)[end - 1];
        while (begin != 0 && is_of(begin - 1, last))
            --begin;
        for (std::size_t at = begin; at != end; ++at) {
            if (const int code = detail::append_line(lines, (*entries)[at], set); code != SEC_S_OK)
                return {code, text()};
        }
    }
    return {SEC_S_OK, std::move(lines)};
}

/*
 * Reads the text of an ACL file from memory, through /proc/self/fd.
 *
 *   lines   the text; may be empty, which gives an ACL without bytes
 *   set     null: acl__default_perm_set
 *
 * Codes: those of sec_read_acl_file for a text; 37, not recorded: no file in memory could be created.
 */
inline result<acl> from_text(std::string_view lines, const sec_perm_set_t *set = nullptr) noexcept {
    const detail::uncancelled until_the_file_is_closed;
    const detail::descriptor file(detail::make_memory_file());
    if (file.number() < 0 || !file.write_all(lines))
        return {detail::unrecorded(SEC_S_FILE_ERROR), acl()};
    char path[32];
    std::snprintf(path, sizeof path, "/proc/self/fd/%d", file.number());
    return acl::read_file(path, nullptr, set, SEC_READ_ACL_TEXT);
}

/* ---- ACLs compared ---- */

namespace detail {

/* Entries in the order of their sub-ACLs' keys, and as they are listed within each. */
class entries_by_key {
public:
    explicit entries_by_key(const acl_entries &entries) noexcept
        : sorted_(new (std::nothrow) entry_fields[entries.size() + 1]), size_(entries.size()) {
        if (!sorted_)
            return;
        std::transform(entries.begin(), entries.end(), sorted_.get(), [](entry_view entry) {
            return entry_fields{entry.type(), entry.permissions(), entry.mechanism(), entry.identity()};
        });
        std::stable_sort(sorted_.get(), sorted_.get() + size_, [](const auto &a, const auto &b) {
            return a.type != b.type ? a.type < b.type : compare_folded(a.mechanism, b.mechanism) < 0;
        });
    }

    [[nodiscard]] bool failed() const noexcept { return !sorted_; }

    [[nodiscard]] bool same_as(const entries_by_key &other) const noexcept {
        const auto is_same = [](const entry_fields &a, const entry_fields &b) {
            return a.type == b.type && a.permissions == b.permissions &&
                   same_folded(a.mechanism, b.mechanism) && same_folded(a.identity, b.identity);
        };
        return std::equal(sorted_.get(), sorted_.get() + size_, other.sorted_.get(),
                          other.sorted_.get() + other.size_, is_same);
    }

private:
    std::unique_ptr<entry_fields[]> sorted_;
    std::size_t size_;
};

} // namespace detail

/*
 * Whether two ACLs are equivalent: the same entries with the same permissions, ignoring letter case and the order
 * of entries, except for the user-expanded entries of a mechanism, of which the first match decides. An ACL
 * without bytes is equivalent to one without entries.
 *
 * Codes: those of sec_list_acl; 6.
 */
inline result<bool> same(const acl &a, const acl &b) noexcept {
    const auto of_a = a.list();
    if (!of_a)
        return {of_a.code(), false};
    const auto of_b = b.list();
    if (!of_b)
        return {of_b.code(), false};
    const detail::entries_by_key sorted_a(*of_a), sorted_b(*of_b);
    if (sorted_a.failed() || sorted_b.failed())
        return {detail::unrecorded(SEC_S_NO_MEMORY), false};
    return {SEC_S_OK, sorted_a.same_as(sorted_b)};
}

} // namespace qz

#endif
