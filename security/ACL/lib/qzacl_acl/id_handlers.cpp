// Identity handlers: registering comparison functions for mechanisms, and looking one up.
#include "qzacl_acl/id_handlers.h"

#include "base/owned.h"
#include "base/uncancelled.h"
#include "qzacl_acl/entry.h"
#include "qzacl_init.h"
#include "report.h"
#include "trace_points.h"

#include <cstring>

using namespace qz;

namespace {

// The name by which callers know the messages of registration.
constexpr char function[] = "acl__register_id_handler";

int report_lock_failure(int line, int error) {
    return report(SEC_S_INTERNAL, msg::state_lock_failed, acl_source, line, error);
}

// Appends a registration. The caller holds the lock.
int append(std::uint32_t kind, const char *mechanism, std::size_t length, sec_id_compare_fn handler) {
    const auto count = static_cast<std::size_t>(acl__state.handler_count);
    const std::size_t size = (count + 1) * sizeof(sec_id_handler_t);
    auto *grown = static_cast<sec_id_handler_t *>(std::realloc(acl__state.handlers, size));
    if (grown == nullptr)
        return report_no_memory(function, size);
    grown[count] = {};
    grown[count].kind = kind;
    std::memcpy(grown[count].mechanism, mechanism, length);
    grown[count].handler = handler;
    acl__state.handlers = grown;
    ++acl__state.handler_count;
    return SEC_S_OK;
}

int register_checked(std::uint32_t kind, const char *mechanism, sec_id_compare_fn handler) {
    if (kind != SEC_ID_HANDLER_EXPANDED && kind != SEC_ID_HANDLER_USER)
        return report_bad_parameter(function, 1, static_cast<int>(kind));
    if (mechanism == nullptr)
        return report_bad_parameter(function, 2, 0);
    if (handler == nullptr)
        return report_bad_parameter(function, 3, 0);
    const std::size_t length = strnlen(mechanism, mechanism_max + 1);
    if (length == 0 || length > mechanism_max)
        return report(SEC_S_BAD_PARAMETER, msg::bad_handler_mechanism);

    if (const int error = pthread_mutex_lock(&acl__state.lock); error != 0)
        return report_lock_failure(__LINE__, error);
    const int result = append(kind, mechanism, length, handler);
    if (const int error = pthread_mutex_unlock(&acl__state.lock); error != 0)
        return report_lock_failure(__LINE__, error);
    return result;
}

} // namespace

int sec__register_id_handler(std::uint32_t kind, const char *mechanism, sec_id_compare_fn handler) {
    const uncancelled until_unlocked;
    return run(operation::register_id_handler, std::tie(kind, mechanism, handler), [&] {
        pthread_once(&acl__init_once_block, acl__state_init);
        return register_checked(kind, mechanism, handler);
    });
}

// While the lock is held, no call is a cancellation point, so cancellation stays as it is.
int sec__get_id_handler(std::uint32_t kind, const char *mechanism, sec_id_compare_fn *handler) {
    pthread_once(&acl__init_once_block, acl__state_init);
    *handler = nullptr;
    if (const int error = pthread_mutex_lock(&acl__state.lock); error != 0)
        return report_lock_failure(__LINE__, error);
    for (std::int32_t index = 0; index < acl__state.handler_count; ++index) {
        const sec_id_handler_t &held = acl__state.handlers[index];
        if (held.kind == kind && cu_strcasecmp_posix_1(held.mechanism, mechanism) == 0) {
            *handler = held.handler;
            break;
        }
    }
    if (const int error = pthread_mutex_unlock(&acl__state.lock); error != 0)
        return report_lock_failure(__LINE__, error);
    return SEC_S_OK;
}
