// The kinds of items in trace records. An item is built from the argument that it shows, after the level test, and
// passes the facility an address and a size for each of its parts.
#ifndef QZACL_TRACE_ITEMS_H
#define QZACL_TRACE_ITEMS_H

#include "qz/acl.h"

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>
#include <tuple>
#include <type_traits>

namespace qz::traced {

// An address and a size, in the exact types that the facility takes.
inline std::tuple<const void *, std::size_t> part(const void *start, std::size_t size_in_bytes) {
    return {start, size_in_bytes};
}

// A string with its NUL; null is recorded as an empty one. A string in an array that a caller filled may lack its NUL
// and ends with the array.
class text {
public:
    template <class Pointer>
    requires(std::is_same_v<Pointer, const char *> ||
             std::is_same_v<Pointer, char *>) explicit text(const Pointer &string)
        : start_(string == nullptr ? "" : string), size_(std::strlen(start_) + 1) {}

    template <std::size_t Size>
    explicit text(const char (&array)[Size]) : start_(array), size_(strnlen(array, Size - 1) + 1) {}

    // A string of known length, with a NUL after it.
    explicit text(std::string_view string) : start_(string.data()), size_(string.size() + 1) {}

    auto parts() const { return part(start_, size_); }

private:
    const char *start_;
    std::size_t size_;
};

// The same, but null is recorded as "<nil>".
class text_or_nil : public text {
public:
    explicit text_or_nil(const char *string) : text(string == nullptr ? "<nil>" : string) {}
};

// A number in the width of its type: 4 bytes, or 8 for sizes and times.
template <class Number>
struct number {
    static_assert(std::is_integral_v<Number> && (sizeof(Number) == 4 || sizeof(Number) == 8));
    Number value;

    auto parts() const { return part(&value, sizeof value); }
};
template <class Number>
number(Number) -> number<Number>;

using signed_number = number<std::int32_t>;
using unsigned_number = number<std::uint32_t>;
using size = number<std::size_t>;
using signed_size = number<std::ptrdiff_t>;

// The value of a pointer. Pointers to characters are texts.
class address {
public:
    template <class Object>
    requires(!std::is_same_v<std::remove_cv_t<Object>, char>) explicit address(Object *pointer)
        : value_(reinterpret_cast<std::uintptr_t>(pointer)) {}

    auto parts() const { return part(&value_, sizeof value_); }

private:
    std::uintptr_t value_;
};

// The length of an ACL and the address of its bytes; 0 and null without an ACL.
class acl_bytes {
public:
    explicit acl_bytes(const sec_acl_buffer_t *acl)
        : length_{acl == nullptr ? 0 : acl->length}, data_(acl == nullptr ? nullptr : acl->data) {}

    auto parts() const { return std::tuple_cat(length_.parts(), data_.parts()); }

private:
    signed_number length_;
    address data_;
};

// The address of the ACL, then the same.
class acl {
public:
    explicit acl(const sec_acl_buffer_t *shown) : address_(shown), bytes_(shown) {}

    auto parts() const { return std::tuple_cat(address_.parts(), bytes_.parts()); }

private:
    address address_;
    acl_bytes bytes_;
};

// An entry: its address, type, permission mask, mechanism and identity; zeros and empty strings without one.
class acle {
public:
    explicit acle(const sec_acle_t *shown)
        : address_(shown), type_{shown == nullptr ? std::uint32_t{0} : shown->type},
          mask_{shown == nullptr ? 0 : shown->perm_mask},
          mechanism_(shown == nullptr ? text("") : text(shown->mechanism)),
          identity_(shown == nullptr ? text("") : text(shown->identity)) {}

    // An entry that is stored at `place` in another form.
    acle(const void *place, std::uint32_t type, std::uint32_t mask, std::string_view mechanism,
         std::string_view identity)
        : address_(place), type_{type}, mask_{mask}, mechanism_(mechanism), identity_(identity) {}

    auto parts() const {
        return std::tuple_cat(address_.parts(), type_.parts(), mask_.parts(), mechanism_.parts(),
                              identity_.parts());
    }

private:
    address address_;
    unsigned_number type_;
    unsigned_number mask_;
    text mechanism_;
    text identity_;
};

// A list of entries: its address and length.
class aclelist {
public:
    explicit aclelist(const sec_aclelist_t *shown)
        : address_(shown), count_{shown == nullptr ? 0 : shown->count} {}

    auto parts() const { return std::tuple_cat(address_.parts(), count_.parts()); }

private:
    address address_;
    signed_number count_;
};

template <class... Each>
struct list {};

// The item can be made from the argument, without narrowing a number.
template <class Item, class Arg>
concept made_of = requires(const Arg &arg) {
    Item{arg};
};

// Items and arguments match in number, and each item can be made from its argument.
template <class Items, class Args>
inline constexpr bool fit = false;

template <class... Items, class... Args>
requires(sizeof...(Items) ==
         sizeof...(Args)) inline constexpr bool fit<list<Items...>, list<Args...>> = (made_of<Items, Args> &&
                                                                                      ...);

} // namespace qz::traced

#endif
