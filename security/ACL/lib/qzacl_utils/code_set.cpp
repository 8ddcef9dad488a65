// Conversion of strings between the locale's code set and UTF-8, with one handle per direction, opened on first use.
#include "qzacl_utils/code_set.h"

#include "report.h"

#include <cstdint>
#include <cstdio>
#include <langinfo.h>
#include <pthread.h>

using namespace qz;

namespace {

cu_iconv_t acl__to_utf8_hdl = nullptr;
cu_iconv_t acl__from_utf8_hdl = nullptr;
pthread_once_t acl__init_to_utf8_once_block = PTHREAD_ONCE_INIT;
pthread_once_t acl__init_from_utf8_once_block = PTHREAD_ONCE_INIT;

constexpr std::uint32_t to_utf8 = 0; // this direction has no flag

// A failure leaves the handle null, and each later conversion in that direction reports it.
void open_handle(std::uint32_t direction, cu_iconv_t *handle) {
    char code_set[256] = {};
    const char *name = cu_utf8_is_assumed_1() != 0 ? "UTF-8" : nl_langinfo(CODESET);
    std::snprintf(code_set, sizeof code_set, "%s", name);
    std::uint32_t flags = direction;
    if (cu_utf8_is_not_modified_1() != 0)
        flags |= CU_ICONV_UTF8_UNMODIFIED;
    if (cu_utf8_is_limited_to_bmp_1() != 0)
        flags |= CU_ICONV_BMP_ONLY;
    static_cast<void>(cu_iconv_open_1(code_set, flags, handle));
}

void acl__init_to_utf8_handle() { open_handle(to_utf8, &acl__to_utf8_hdl); }
void acl__init_from_utf8_handle() { open_handle(CU_ICONV_FROM_UTF8, &acl__from_utf8_hdl); }

int convert_string(const char *function, cu_iconv_t handle, const char *in, const std::size_t *in_length,
                   char **out, std::size_t *out_length) {
    if (handle == nullptr)
        return report(SEC_S_CODESET, msg::conversion_unavailable);
    constexpr int line = __LINE__ + 1; // the line of the call
    const int result = cu_iconv_str_1(handle, 0, in, in_length, out, out_length);
    switch (result) {
    case CU_OK:
        return SEC_S_OK;
    case CU_NO_RESOURCE:
    case CU_INTERNAL:
        return report(SEC_S_INTERNAL, msg::internal_failure, utils_source, line, result);
    case CU_ICONV_NO_MEMORY:
        return report_no_memory(function, *in_length);
    default:
        return report(SEC_S_CODESET, msg::conversion_failed);
    }
}

} // namespace

int acl__convert_to_utf8(const char *in, const std::size_t *in_length, char **out, std::size_t *out_length) {
    pthread_once(&acl__init_to_utf8_once_block, acl__init_to_utf8_handle);
    return convert_string("acl__convert_to_utf8", acl__to_utf8_hdl, in, in_length, out, out_length);
}

int acl__convert_from_utf8(const char *in, const std::size_t *in_length, char **out,
                           std::size_t *out_length) {
    pthread_once(&acl__init_from_utf8_once_block, acl__init_from_utf8_handle);
    return convert_string("acl__convert_from_utf8", acl__from_utf8_hdl, in, in_length, out, out_length);
}
