// Whole compiled buffers: making, taking over and releasing.
#include "base/owned.h"
#include "qzacl_acl/buffer_format.h"
#include "report.h"
#include "trace_points.h"

using namespace qz;

namespace {

int read_checked(int length, const void *data, sec_acl_buffer_t *acl) {
    constexpr const char *function = "sec_read_acl_from_data";
    if (length < 1)
        return report_bad_parameter(function, 1, length);
    if (data == nullptr)
        return report_bad_parameter(function, 2, 0);
    if (acl == nullptr)
        return report_bad_parameter(function, 3, 0);
    const auto size = static_cast<std::size_t>(length);
    auto copy = allocate<unsigned char>(size);
    if (copy == nullptr)
        return report_no_memory(function, size);
    std::memcpy(copy.get(), data, size);
    *acl = {length, copy.release()};
    return SEC_S_OK;
}

int release_checked(sec_acl_buffer_t *acl) {
    if (acl == nullptr || acl->data == nullptr)
        return SEC_S_OK;
    // The first byte exists even if the length is wrong.
    if (*static_cast<const unsigned char *>(acl->data) != format::buffer_type)
        return report(SEC_S_BAD_ACL, msg::acl_corrupted);
    std::free(acl->data);
    *acl = {};
    return SEC_S_OK;
}

} // namespace

int sec_create_empty_acl(sec_acl_buffer_t *acl) {
    constexpr const char *function = "sec_create_empty_acl";
    if (acl == nullptr)
        return report_bad_parameter(function, 1, 0);
    acl->data = std::malloc(sizeof format::empty_acl);
    if (acl->data == nullptr)
        return report_no_memory(function, sizeof format::empty_acl);
    std::memcpy(acl->data, format::empty_acl, sizeof format::empty_acl);
    acl->length = sizeof format::empty_acl;
    return SEC_S_OK;
}

int sec_read_acl_from_data(int length, const void *data, sec_acl_buffer_t *acl) {
    return run(operation::read_acl_from_data, std::tie(length, data, acl),
               [&] { return read_checked(length, data, acl); });
}

int sec_release_acl(sec_acl_buffer_t *acl) {
    return run(operation::release_acl, std::tie(acl), [&] { return release_checked(acl); });
}
