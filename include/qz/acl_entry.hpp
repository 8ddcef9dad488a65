/*
 * Entries and lists of them: part of <qz/acl.hpp>, which states the rules.
 */
#ifndef QZ_ACL_ENTRY_HPP
#define QZ_ACL_ENTRY_HPP

#include <qz/acl_result.hpp>

#include <cstddef>
#include <cstdint>
#include <iterator>
#include <memory>
#include <string_view>
#include <utility>

namespace qz {

/* ---- Entries ---- */

/* The mechanism and identity of an entry in the locale's code set. Owns both texts. */
class entry_texts {
public:
    /* No texts. */
    entry_texts() noexcept = default;

    /* The texts; empty if the entry's type takes none. */
    [[nodiscard]] std::string_view mechanism() const noexcept { return mechanism_ ? mechanism_.get() : ""; }
    [[nodiscard]] std::string_view identity() const noexcept { return identity_ ? identity_.get() : ""; }

private:
    friend class entry_view;

    struct release {
        void operator()(char *text) const noexcept { std::free(text); }
    };

    std::unique_ptr<char, release> mechanism_;
    std::unique_ptr<char, release> identity_;
};

/*
 * A view of an entry owned by a list, an acl_entry, or the caller. As cheap to copy as a pointer, and valid
 * as long as the entry. The view of an empty acl_entry, or of null, shows type 0 and no texts or permissions;
 * operations reject it like a null entry.
 */
class entry_view {
public:
    entry_view(const sec_acle_t &entry) noexcept : entry_(&entry) {}
    explicit entry_view(const sec_acle_t *entry) noexcept : entry_(entry) {}

    /* SEC_ACLE_... */
    [[nodiscard]] std::uint8_t type() const noexcept {
        return entry_ != nullptr ? entry_->type : std::uint8_t{0};
    }

    /* The permissions, one bit each. */
    [[nodiscard]] std::uint32_t permissions() const noexcept {
        return entry_ != nullptr ? entry_->perm_mask : 0;
    }

    /* The texts in UTF-8; empty if the type takes none. */
    [[nodiscard]] std::string_view mechanism() const noexcept {
        return entry_ != nullptr ? entry_->mechanism : "";
    }
    [[nodiscard]] std::string_view identity() const noexcept {
        return entry_ != nullptr && entry_->identity != nullptr ? entry_->identity : "";
    }

    /* The texts to be shown, in the locale's code set. Codes: those of sec_display_acle_id. */
    [[nodiscard]] result<entry_texts> displayed() const noexcept {
        entry_texts texts;
        char *mechanism = nullptr;
        char *identity = nullptr;
        const int code = sec_display_acle_id(entry_, &mechanism, &identity);
        texts.mechanism_.reset(mechanism);
        texts.identity_.reset(identity);
        return {code, std::move(texts)};
    }

    /* Prints the entry as sec__dump_acle does. */
    void dump(const sec_perm_set_t *set = nullptr, const char *indentation = "") const noexcept {
        sec__dump_acle(entry_, set, indentation);
    }

    /* The record, for functions of the C interface; may be null. */
    [[nodiscard]] const sec_acle_t *get() const noexcept { return entry_; }

private:
    const sec_acle_t *entry_;
};

/* An owned entry. */
class acl_entry {
public:
    /* No entry. */
    acl_entry() noexcept = default;

    /*
     * Creates an entry from texts in the locale's code set.
     *
     *   type         SEC_ACLE_...
     *   mechanism    types 4 and 8; others: ignored, may be null
     *   identity     types 4, 8 and 16; others: ignored, may be null
     *
     * Codes: those of sec_create_acle.
     */
    [[nodiscard]] static result<acl_entry> create(std::uint8_t type, std::uint32_t permissions,
                                                  const char *mechanism = nullptr,
                                                  const char *identity = nullptr) noexcept {
        sec_acle_t *made = nullptr;
        const int code = sec_create_acle(type, permissions, mechanism, identity, &made);
        return {code, acl_entry(made)};
    }

    /* Takes ownership of an entry that sec_create_acle made; may be null. */
    explicit acl_entry(sec_acle_t *owned) noexcept : entry_(owned) {}

    /* The entry as an argument of operations, and to read its parts. */
    [[nodiscard]] entry_view view() const noexcept { return entry_view(entry_.get()); }
    operator entry_view() const noexcept { return view(); }

    /* The record, for functions of the C interface, or to change its permissions; null when empty. */
    [[nodiscard]] sec_acle_t *get() const noexcept { return entry_.get(); }

private:
    struct release {
        void operator()(sec_acle_t *entry) const noexcept { sec_release_acle(entry); }
    };

    std::unique_ptr<sec_acle_t, release> entry_;
};

/* The result of a listing: a range of entry_view in the order of the list. */
class acl_entries {
public:
    /* A forward iterator over the entries whose elements are values; valid as long as the list. */
    class iterator {
    public:
        using iterator_concept = std::forward_iterator_tag;
        using iterator_category = std::input_iterator_tag;
        using value_type = entry_view;
        using difference_type = std::ptrdiff_t;
        using reference = entry_view;
        using pointer = void;

        iterator() noexcept = default;
        [[nodiscard]] entry_view operator*() const noexcept { return entry_view(*at_); }
        iterator &operator++() noexcept { return ++at_, *this; }
        iterator operator++(int) noexcept { return iterator(at_++); }
        [[nodiscard]] friend bool operator==(iterator a, iterator b) noexcept { return a.at_ == b.at_; }
        [[nodiscard]] friend bool operator!=(iterator a, iterator b) noexcept { return a.at_ != b.at_; }

    private:
        friend class acl_entries;
        explicit iterator(sec_acle_t *const *at) noexcept : at_(at) {}

        sec_acle_t *const *at_ = nullptr;
    };
    using const_iterator = iterator;

    /* No entries. */
    acl_entries() noexcept = default;

    /* Takes ownership of a list of the C interface. */
    explicit acl_entries(sec_aclelist_t owned) noexcept : list_(owned) {}

    acl_entries(acl_entries &&other) noexcept : list_(std::exchange(other.list_, sec_aclelist_t{})) {}
    acl_entries &operator=(acl_entries &&other) noexcept {
        acl_entries taken(std::move(other));
        std::swap(list_, taken.list_);
        return *this;
    }
    ~acl_entries() { sec_release_aclelist(&list_); }

    [[nodiscard]] std::size_t size() const noexcept { return static_cast<std::size_t>(list_.count); }
    [[nodiscard]] bool empty() const noexcept { return list_.count == 0; }

    /* The entry at a position below size(). */
    [[nodiscard]] entry_view operator[](std::size_t place) const noexcept { return *list_.acles[place]; }

    [[nodiscard]] iterator begin() const noexcept { return iterator(list_.acles); }
    [[nodiscard]] iterator end() const noexcept { return iterator(list_.acles + list_.count); }

private:
    sec_aclelist_t list_ = {};
};

} // namespace qz

#endif
