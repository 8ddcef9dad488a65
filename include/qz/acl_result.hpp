/*
 * Results, recorded errors and permission letters: part of <qz/acl.hpp>, which states the rules.
 */
#ifndef QZ_ACL_RESULT_HPP
#define QZ_ACL_RESULT_HPP

#include <qz/acl.h>
#include <qz/cu.h>

#include <cstdint>
#include <memory>
#include <string_view>
#include <utility>

namespace qz {

/* ---- Results ---- */

/*
 * A code and, after SEC_S_OK, the value. After a failure the value is empty (an owner of nothing, no
 * permissions) unless the operation says otherwise.
 */
template <class T>
class [[nodiscard]] result {
public:
    result(int code, T value) noexcept : code_(code), value_(std::move(value)) {}

    /* SEC_S_..., of the operation. */
    [[nodiscard]] int code() const noexcept { return code_; }

    /* Whether the operation succeeded. */
    explicit operator bool() const noexcept { return code_ == SEC_S_OK; }

    /*
     * The value; moved out of an expiring result, so that a range-for over "*acl.list()" is safe.
     */
    /* Laid out by hand, because versions of clang-format disagree on the blank behind "&". */
    /* clang-format off */
    [[nodiscard]] T &operator*() & noexcept { return value_; }
    [[nodiscard]] const T &operator*() const & noexcept { return value_; }
    [[nodiscard]] T operator*() && noexcept { return std::move(value_); }
    /* clang-format on */
    [[nodiscard]] T *operator->() noexcept { return &value_; }
    [[nodiscard]] const T *operator->() const noexcept { return &value_; }

private:
    int code_;
    T value_;
};

/* A copy of a thread's recorded error, with its text. Movable; other threads may read it. */
class error {
public:
    /*
     * Copies the calling thread's recorded error, which stays recorded. If there is no memory for the copy,
     * the code is CU_NO_MEMORY, without message and text; if there is none for the text only, the text is
     * empty.
     *
     * Uses cu_get_error_1 and cu_get_errmsg_1.
     */
    [[nodiscard]] static error current() noexcept {
        error made;
        cu_error_t *handle = nullptr;
        char *text = nullptr;
        made.code_ = cu_get_error_1(&handle);
        if (handle != nullptr) {
            made.code_ = handle->code;
            made.message_id_ = handle->message_id;
            if (cu_get_errmsg_1(handle, &text) == CU_OK)
                made.text_.reset(text);
            cu_rel_error_1(handle);
        }
        return made;
    }

    /* The code that the failing operation returned; 0 when no error was recorded. */
    [[nodiscard]] int code() const noexcept { return code_; }

    /* The message's index in the message table; the number used in descriptions is in the text. */
    [[nodiscard]] int message_id() const noexcept { return message_id_; }

    /* The message to be shown: with its number and a final line feed. */
    [[nodiscard]] std::string_view text() const noexcept { return text_ ? text_.get() : ""; }

    /* Whether an error was recorded. */
    explicit operator bool() const noexcept { return code_ != CU_OK; }

private:
    struct release {
        void operator()(char *text) const noexcept { cu_rel_errmsg_1(text); }
    };

    error() noexcept = default;

    int code_ = CU_OK;
    int message_id_ = 0;
    std::unique_ptr<char, release> text_;
};

/* ---- Permissions ---- */

/* The letters of a mask. */
class permission_letters {
public:
    /* The letters, from the lowest bit to the highest. */
    [[nodiscard]] std::string_view view() const noexcept { return text_; }
    [[nodiscard]] const char *c_str() const noexcept { return text_; }

private:
    friend result<permission_letters> to_letters(std::uint32_t mask, const sec_perm_set_t *set) noexcept;

    char text_[33] = "";
};

/*
 * Converts permission letters to a mask.
 *
 *   letters   may be null, as for sec_translate_perms
 *   set       null: acl__default_perm_set
 *
 * Codes: those of sec_translate_perms. After 36 the value holds the letters before the unknown one.
 */
inline result<std::uint32_t> to_mask(const char *letters, const sec_perm_set_t *set = nullptr) noexcept {
    std::uint32_t mask = 0;
    const int code = sec_translate_perms(letters, set, &mask);
    return {code, mask};
}

/*
 * Converts a mask to permission letters. Allocates nothing.
 *
 *   set   null: acl__default_perm_set
 *
 * Codes: those of sec_translate_bitmask. After a failure there are no letters.
 */
inline result<permission_letters> to_letters(std::uint32_t mask,
                                             const sec_perm_set_t *set = nullptr) noexcept {
    permission_letters letters;
    const int code = sec_translate_bitmask(mask, set, letters.text_);
    if (code != SEC_S_OK)
        letters.text_[0] = '\0';
    return {code, letters};
}

} // namespace qz

#endif
