/*
 * Access control lists for C++17 and later: owners, views and results for <qz/acl.h> and <qz/cu.h>.
 *
 * Everything here is inline, needs neither exceptions nor RTTI, and links only to libqzacl and libqz_cu. It
 * adds RAII owners for the results of the C interface and keeps its rules: for codes, recorded errors, code
 * sets, trust, order, threads and forks, see the top of <qz/acl.h> and the C function that a description
 * names. "Codes: those of F" includes its messages. Call functions that need no owner as in C:
 * sec__register_id_handler. The flags, types and codes SEC_... are those of C, too. A handler must not change,
 * assign to or destroy the acl that is being evaluated.
 *
 * Texts passed in are pointers to NUL-terminated strings, as the C functions need them; texts returned are
 * views whose data() ends with a NUL.
 *
 * Owners are movable but not copyable. A moved-from or default-constructed owner is empty: all its operations
 * may be called, and it may be assigned to. Destroying or assigning an owner does not change the recorded
 * error, so you can inspect a failure after the owner is gone. Const operations are "Threads: shared", others
 * "Threads: exclusive".
 *
 * The parts:
 *
 *   <qz/acl_result.hpp>   result, error; to_mask, to_letters
 *   <qz/acl_entry.hpp>    acl_entry, entry_view, acl_entries, entry_texts
 *   here                  party, decision, acl
 */
#ifndef QZ_ACL_HPP
#define QZ_ACL_HPP

#include <qz/acl_entry.hpp>

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <iterator>
#include <limits>
#include <string_view>
#include <type_traits>
#include <utility>

namespace qz {

/* ---- Access decisions ---- */

/*
 * The result of an evaluation: permissions, no matching entry, or a failure.
 */
class [[nodiscard]] decision {
public:
    decision(int code, std::uint32_t permissions) noexcept : code_(code), permissions_(permissions) {}

    /* SEC_S_OK, SEC_S_BAD_ACLE or the failure. */
    [[nodiscard]] int code() const noexcept { return code_; }

    /* Whether an entry decided, even if it grants nothing. */
    explicit operator bool() const noexcept { return code_ == SEC_S_OK; }

    /* Whether no entry matches: nothing is granted, and you can ask the next question. */
    [[nodiscard]] bool no_entry() const noexcept { return code_ == SEC_S_BAD_ACLE; }

    /* Whether the evaluation failed: nothing is granted, and the recorded error says why. */
    [[nodiscard]] bool failed() const noexcept { return !*this && !no_entry(); }

    /* The permissions; none unless an entry decided. */
    [[nodiscard]] std::uint32_t permissions() const noexcept { return *this ? permissions_ : 0; }

    /* Whether an entry decided and grants all of these permissions. */
    [[nodiscard]] bool grants(std::uint32_t wanted) const noexcept {
        return *this && (permissions_ & wanted) == wanted;
    }

private:
    int code_;
    std::uint32_t permissions_;
};

/* The subject of a decision. Stores the given pointers without copying. */
class party {
public:
    /* Anyone who did not authenticate, and anyone else who did. */
    [[nodiscard]] static constexpr party unauthenticated() noexcept { return {SEC_ACLE_UNAUTHENTICATED}; }
    [[nodiscard]] static constexpr party any_other() noexcept { return {SEC_ACLE_ANYOTHER}; }

    /* An identity of a mechanism, both UTF-8, for user and for user-expanded entries. */
    [[nodiscard]] static constexpr party user(const char *mechanism, const char *identity) noexcept {
        return {SEC_ACLE_USER, mechanism, identity};
    }
    [[nodiscard]] static constexpr party expanded(const char *mechanism, const char *identity) noexcept {
        return {SEC_ACLE_EXPANDED, mechanism, identity};
    }

    /* The same party, compared with user entries by the mechanism's SEC_ID_HANDLER_USER. */
    [[nodiscard]] constexpr party through_handler() const noexcept {
        party changed = *this;
        changed.type_ = static_cast<std::uint8_t>(type_ | SEC_ACLE_USE_ID_HANDLER);
        return changed;
    }

    /* The same party, searched for among the entries of another mechanism; null: its own. */
    [[nodiscard]] constexpr party among_entries_of(const char *mechanism) const noexcept {
        party changed = *this;
        changed.subacl_mechanism_ = mechanism;
        return changed;
    }

private:
    friend class acl;

    constexpr party(std::uint8_t type, const char *mechanism = nullptr,
                    const char *identity = nullptr) noexcept
        : type_(type), mechanism_(mechanism), identity_(identity) {}

    std::uint8_t type_;
    const char *mechanism_;
    const char *subacl_mechanism_ = nullptr;
    const char *identity_;
};

/* ---- Buffers ---- */

/*
 * A compiled ACL. A default-constructed one has no bytes, like that of a file without entries. Listing and
 * editing take such an ACL; evaluating it fails with 42 (3417-109), so test bytes().empty() first.
 */
class acl {
public:
    /* An ACL without bytes. */
    acl() noexcept = default;

    /* Takes ownership of a buffer of the C interface. */
    explicit acl(sec_acl_buffer_t owned) noexcept : buffer_(owned) {}

    acl(acl &&other) noexcept : buffer_(other.release()) {}
    acl &operator=(acl &&other) noexcept {
        acl taken(std::move(other));
        std::swap(buffer_, taken.buffer_);
        return *this;
    }
    /* sec_release_acl would keep bytes that are not an ACL and clear the recorded error. */
    ~acl() { std::free(buffer_.data); }

    /*
     * Creates an ACL without entries, which has bytes and can be evaluated. Codes: those of
     * sec_create_empty_acl.
     */
    [[nodiscard]] static result<acl> create_empty() noexcept {
        acl made;
        const int code = sec_create_empty_acl(&made.buffer_);
        if (code != SEC_S_OK)
            made.buffer_ = {};
        return {code, std::move(made)};
    }

    /*
     * Reads an ACL file.
     *
     *   path        the file; with user a bare file name
     *   user        null, or the user in whose home directory the file is
     *   set         the permissions of the text; null: acl__default_perm_set. With another set, pass
     *               SEC_READ_ACL_TEXT: a cache file does not record its set.
     *   flags       SEC_READ_ACL_...; by default the bytes of a cache file are checked
     *   out_flags   out, may be null: the resulting flags
     *
     * Codes: those of sec_read_acl_file.
     */
    [[nodiscard]] static result<acl> read_file(const char *path, const char *user = nullptr,
                                               const sec_perm_set_t *set = nullptr,
                                               std::uint32_t flags = SEC_READ_ACL_CONVERT,
                                               std::uint32_t *out_flags = nullptr) noexcept {
        acl made;
        const int code = sec_read_acl_file(path, user, set, flags, &made.buffer_, out_flags);
        return {code, std::move(made)};
    }

    /*
     * Copies bytes from elsewhere, unchecked: call to_host before anything else. More than 2^31 - 1 bytes are
     * rejected as if there were none.
     *
     * Codes: those of sec_read_acl_from_data.
     */
    [[nodiscard]] static result<acl> from_bytes(const void *data, std::size_t size) noexcept {
        constexpr std::size_t most = std::numeric_limits<std::int32_t>::max();
        acl made;
        const int code =
            sec_read_acl_from_data(size <= most ? static_cast<int>(size) : 0, data, &made.buffer_);
        return {code, std::move(made)};
    }

    /*
     * Converts the ACL to host byte order, in place. With check, also checks its structure, even if it had to
     * be converted, for which the C function needs two calls. After a failure, only destroy or assign it.
     *
     * Codes: those of sec_convert_acl_to_host.
     */
    [[nodiscard]] int to_host(bool check = true) noexcept {
        const std::string_view held = bytes();
        constexpr char host_order = __BYTE_ORDER__ == __ORDER_LITTLE_ENDIAN__ ? 2 : 1;
        const bool converts = held.size() > 2 && held[2] != host_order;
        const int code = sec_convert_acl_to_host(check ? 1 : 0, &buffer_);
        return code == SEC_S_OK && check && converts ? sec_convert_acl_to_host(1, &buffer_) : code;
    }

    /*
     * add adds an entry or gives an existing one the new permissions; add_new rejects a duplicate; remove
     * deletes the entry, whatever its permissions.
     *
     * Codes: those of sec_add_acle_to_acl, sec_add_acle_to_acl2 and sec_del_acle_from_acl.
     */
    [[nodiscard]] int add(entry_view entry) noexcept { return sec_add_acle_to_acl(entry.get(), &buffer_); }
    [[nodiscard]] int add_new(entry_view entry) noexcept {
        return sec_add_acle_to_acl2(entry.get(), &buffer_);
    }
    [[nodiscard]] int remove(entry_view entry) noexcept {
        return sec_del_acle_from_acl(entry.get(), &buffer_);
    }

    /* Lists all entries. Codes: those of sec_list_acl. */
    [[nodiscard]] result<acl_entries> list() const noexcept {
        sec_aclelist_t entries = {};
        const int code = sec_list_acl(&buffer_, &entries);
        return {code, acl_entries(entries)};
    }

    /*
     * Lists the entries of a type, of one mechanism or of all (null). Codes: those of sec_list_acl_by_type.
     */
    [[nodiscard]] result<acl_entries> list(std::uint8_t type,
                                           const char *mechanism = nullptr) const noexcept {
        sec_aclelist_t entries = {};
        const int code = sec_list_acl_by_type(&buffer_, type, mechanism, &entries);
        return {code, acl_entries(entries)};
    }

    /*
     * Evaluates what a party is granted. Allocates nothing; <qz/acl.h> lists the exceptions under "Memory".
     *
     * Codes: those of sec__single_acle_perm.
     */
    decision single(party whom) const noexcept {
        std::uint32_t mask = 0;
        const int code = sec__single_acle_perm(&buffer_, whom.type_, whom.mechanism_, whom.subacl_mechanism_,
                                               whom.identity_, &mask);
        return {code, mask};
    }

    /*
     * Evaluates what groups are granted together. Allocates nothing. More than 2^31 - 1 groups count as
     * groups without an entry.
     *
     *   first    an array of groups; may be null if count is 0
     *   range    or a container, array or span of them
     *
     * Codes: those of sec__group_acles_perm.
     */
    decision groups(const sec_group_ref_t *first, std::size_t count) const noexcept {
        constexpr std::size_t most = std::numeric_limits<std::int32_t>::max();
        std::uint32_t mask = 0;
        const int code = sec__group_acles_perm(
            &buffer_, count <= most ? static_cast<std::int32_t>(count) : -1, first, &mask);
        return {code, mask};
    }
    template <class Range, class = std::enable_if_t<std::is_convertible_v<
                               decltype(std::data(std::declval<const Range &>())), const sec_group_ref_t *>>>
    decision groups(const Range &range) const noexcept {
        return groups(std::data(range), std::size(range));
    }

    /* The compiled bytes, valid until the ACL changes. */
    [[nodiscard]] std::string_view bytes() const noexcept {
        return {static_cast<const char *>(buffer_.data), static_cast<std::size_t>(buffer_.length)};
    }

    /* Prints the ACL as sec__dump_acl does. */
    void dump() const noexcept { sec__dump_acl(&buffer_); }

    /* The descriptor, for functions of the C interface. */
    [[nodiscard]] sec_acl_buffer_t *get() noexcept { return &buffer_; }
    [[nodiscard]] const sec_acl_buffer_t *get() const noexcept { return &buffer_; }

    /* Gives up the bytes, which the caller then releases; the ACL is left empty. */
    [[nodiscard]] sec_acl_buffer_t release() noexcept { return std::exchange(buffer_, sec_acl_buffer_t{}); }

private:
    sec_acl_buffer_t buffer_ = {};
};

} // namespace qz

#endif
