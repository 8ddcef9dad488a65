// Recording an error: every failing operation records exactly one message and returns its code. Nothing is formatted
// until somebody fetches the text.
#ifndef QZ_REPORT_H
#define QZ_REPORT_H

#include "base/owned.h"
#include "msg/messages.h"
#include "qz/acl.h"
#include "qz/cu.h"

#include <climits>
#include <cstddef>
#include <cstdint>
#include <type_traits>

namespace qz {

// The source paths in located messages. The line next to a path is that of the failing check.
inline constexpr char acl_source[] = "security/ACL/lib/qzacl_acl";
inline constexpr char utils_source[] = "security/ACL/lib/qzacl_utils";

// Records a message and returns its code.
template <int Id, class... Args>
int report(int code, msg::message<Id, Args...>, std::type_identity_t<Args>... args) {
    cu_set_error_1(code, 0, msg::catalog_name, msg::catalog_set, Id, msg::shown_text(Id), args...);
    return code;
}

// A code and its message, for functions whose callers report the same failure under different ones.
template <class... Args>
struct failure_kind {
    template <int Id>
    constexpr failure_kind(int its_code, msg::message<Id, Args...>) : code(its_code), id(Id) {}

    int code;
    int id;
};

template <class... Args>
int report(const failure_kind<Args...> &kind, std::type_identity_t<Args>... args) {
    cu_set_error_1(kind.code, 0, msg::catalog_name, msg::catalog_set, kind.id,
                   cu_mesgtbl_qzseclib_msg[static_cast<std::size_t>(kind.id)], args...);
    return kind.code;
}

// A size as a message shows it: conversions take an int, so larger sizes are shown as INT_MAX.
template <class Size>
constexpr int shown_size(Size size) {
    static_assert(std::is_integral_v<Size>);
    if constexpr (sizeof(Size) > sizeof(int) || std::is_unsigned_v<Size>)
        return size > static_cast<Size>(INT_MAX) ? INT_MAX : static_cast<int>(size);
    else
        return size;
}

inline int report_no_memory(const char *function, std::uint64_t bytes) {
    return report(SEC_S_NO_MEMORY, msg::no_memory, function, shown_size(bytes));
}

inline int report_no_memory(const char *function, shortage lacking) {
    return report_no_memory(function, lacking.bytes());
}

inline int report_bad_parameter(const char *function, int position, int value) {
    return report(SEC_S_BAD_PARAMETER, msg::incorrect_parameter, function, position, value);
}

// For structural faults without a message of their own: a part does not end where it should, or the bytes end
// early.
inline int report_corrupt(int line) { return report(SEC_S_BAD_ACL, msg::buffer_corrupted, acl_source, line); }

// A pointer as the parameter message shows it, truncated to the width of its conversion.
inline int shown_pointer(const void *pointer) {
    return static_cast<int>(static_cast<std::uint32_t>(reinterpret_cast<std::uintptr_t>(pointer)));
}

} // namespace qz

#endif
