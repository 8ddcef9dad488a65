// Conversion of strings between the locale's code set and UTF-8, and reading a whole file.
#include "qzacl_utils.h"

#include "base/open_file.h"
#include "qzacl_trace.h"
#include "report.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <langinfo.h>
#include <limits>

namespace {

cu_iconv_t acl__to_utf8_hdl = nullptr;
cu_iconv_t acl__from_utf8_hdl = nullptr;
pthread_once_t acl__init_to_utf8_once_block = PTHREAD_ONCE_INIT;
pthread_once_t acl__init_from_utf8_once_block = PTHREAD_ONCE_INIT;

// A failed open leaves the handle null; each later conversion in that direction reports it.
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

void acl__init_to_utf8_handle() { open_handle(0, &acl__to_utf8_hdl); }
void acl__init_from_utf8_handle() { open_handle(CU_ICONV_FROM_UTF8, &acl__from_utf8_hdl); }

int convert(const char *function, cu_iconv_t handle, const char *in, const std::size_t *in_length, char **out,
            std::size_t *out_length) {
    constexpr int facility_no_memory = 15;
    if (handle == nullptr)
        return qz::report(SEC_S_CODESET, qz::msg::conversion_unavailable);
    constexpr int line = __LINE__ + 1; // of the call that may fail
    const int result = cu_iconv_str_1(handle, 0, in, in_length, out, out_length);
    switch (result) {
    case 0:
        return SEC_S_OK;
    case 17:
    case 20:
        return qz::report(SEC_S_INTERNAL, qz::msg::internal_failure, qz::utils_source, line, result);
    case facility_no_memory:
        return qz::report_no_memory(function, *in_length);
    default:
        return qz::report(SEC_S_CODESET, qz::msg::conversion_failed);
    }
}

// Whether the file is the one that was vetted by its name, and still owned and protected as it was then.
bool is_as_vetted(const struct stat &opened, const struct stat &vetted) {
    return qz::same_file(opened, vetted) && S_ISREG(opened.st_mode) && opened.st_mode == vetted.st_mode &&
           opened.st_uid == vetted.st_uid && opened.st_gid == vetted.st_gid;
}

int not_found(const char *file_name, int error) {
    if (qz::traces(qz::trace_category::info))
        qz::trace_data(123, qz::item(file_name), qz::number(error));
    return qz::report(SEC_S_FILE_ERROR, qz::msg::bad_file_name, file_name, error);
}

int read_file(const char *file_name, int fd, const struct stat &vetted, qz::file_bytes &file) {
    struct stat status = {};
    if (fstat(fd, &status) != 0)
        return not_found(file_name, errno);
    if (!is_as_vetted(status, vetted)) {
        file.is_replaced = true;
        return not_found(file_name, ESTALE);
    }
    if (status.st_size == 0)
        return SEC_S_OK;
    // On a 32-bit machine a file may be larger than memory can be, and its size wrap to that of a small one.
    const auto size = static_cast<std::size_t>(std::min<std::uintmax_t>(
        static_cast<std::uintmax_t>(status.st_size), std::numeric_limits<std::ptrdiff_t>::max()));
    auto text = qz::allocate<char>(size + qz::text_padding);
    if (text == nullptr) {
        if (qz::traces(qz::trace_category::info))
            qz::trace_data(125, qz::item(file_name), qz::number(size));
        return qz::report_no_memory("sec_read_acl_file", size);
    }
    errno = 0;
    const ssize_t count = read(fd, text.get(), size);
    if (count != status.st_size) {
        const int error = errno;
        if (qz::traces(qz::trace_category::info))
            qz::trace_data(127, qz::item(file_name), qz::number(size), qz::number(count));
        return qz::report(SEC_S_FILE_ERROR, qz::msg::short_read, qz::shown_size(count), qz::shown_size(size),
                          error);
    }
    std::memset(text.get() + size, '\0', qz::text_padding);
    file.data = std::move(text);
    file.length = size;
    return SEC_S_OK;
}

} // namespace

namespace qz {

descriptor open_vetted(const char *path, int access, const struct stat &vetted) {
    descriptor file = open_file(path, access | O_NONBLOCK);
    if (!file)
        return file;
    struct stat opened = {};
    if (fstat(file.get(), &opened) != 0 || !is_as_vetted(opened, vetted)) {
        file.close();
        errno = ESTALE;
    }
    return file;
}

} // namespace qz

int acl__convert_to_utf8(const char *in, const std::size_t *in_length, char **out, std::size_t *out_length) {
    pthread_once(&acl__init_to_utf8_once_block, acl__init_to_utf8_handle);
    return convert("acl__convert_to_utf8", acl__to_utf8_hdl, in, in_length, out, out_length);
}

int acl__convert_from_utf8(const char *in, const std::size_t *in_length, char **out,
                           std::size_t *out_length) {
    pthread_once(&acl__init_from_utf8_once_block, acl__init_from_utf8_handle);
    return convert("acl__convert_from_utf8", acl__from_utf8_hdl, in, in_length, out, out_length);
}

int acl__lock_acl_file(const char * /*file_name*/, int /*fd*/, int /*mode*/) { return 0; }

int acl__read_acl_file(const char *file_name, int fd, const struct stat &vetted, qz::file_bytes &bytes) {
    const bool is_timed = qz::trace_level(qz::trace_category::perf) == 2;
    const std::uint64_t start = is_timed ? qz::read_counter() : 0;
    bytes = {};
    const int result = read_file(file_name, fd, vetted, bytes);
    if (is_timed)
        qz::trace_elapsed(6, start);
    return result;
}

namespace qz {

int lock_and_read(const char *path, const descriptor &file, const struct stat &vetted, file_bytes &bytes) {
    constexpr int for_reading = 1;
    if (const int result = acl__lock_acl_file(path, file.get(), for_reading); result != 0)
        return result;
    return acl__read_acl_file(path, file.get(), vetted, bytes);
}

} // namespace qz
