// Opening a vetted file and reading it whole.
#include "qzacl_utils/file_bytes.h"

#include "base/open_file.h"
#include "report.h"
#include "trace_points.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <fcntl.h>
#include <limits>

using namespace qz;

namespace {

// True when the opened file is the vetted one, with the same owner, group and mode.
bool is_as_vetted(const struct stat &opened, const struct stat &vetted) {
    return same_file(opened, vetted) && S_ISREG(opened.st_mode) && opened.st_mode == vetted.st_mode &&
           opened.st_uid == vetted.st_uid && opened.st_gid == vetted.st_gid;
}

int not_found(const char *file_name, int error) {
    trace(point::file_not_examined, file_name, error);
    return report(SEC_S_FILE_ERROR, msg::bad_file_name, file_name, error);
}

int read_file(const char *file_name, int fd, const struct stat &vetted, file_bytes &file) {
    struct stat status = {};
    if (fstat(fd, &status) != 0)
        return not_found(file_name, errno);
    if (!is_as_vetted(status, vetted)) {
        file.is_replaced = true;
        return not_found(file_name, ESTALE);
    }
    if (status.st_size == 0)
        return SEC_S_OK;
    // On a 32-bit machine a file may exceed the address space, and its size wrap to a small number.
    const auto size = static_cast<std::size_t>(std::min<std::uintmax_t>(
        static_cast<std::uintmax_t>(status.st_size), std::numeric_limits<std::ptrdiff_t>::max()));
    auto text = allocate<char>(size + text_padding);
    if (text == nullptr) {
        trace(point::no_memory_for_file, file_name, size);
        return report_no_memory("sec_read_acl_file", size);
    }
    errno = 0;
    const ssize_t count = read(fd, text.get(), size);
    if (count != status.st_size) {
        const int error = errno;
        trace(point::read_is_short, file_name, size, count);
        return report(SEC_S_FILE_ERROR, msg::short_read, shown_size(count), shown_size(size), error);
    }
    std::memset(text.get() + size, '\0', text_padding);
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

int acl__lock_acl_file(const char * /*file_name*/, int /*fd*/, lock_purpose /*purpose*/) { return 0; }

int acl__read_acl_file(const char *file_name, int fd, const struct stat &vetted, file_bytes &bytes) {
    const trace_timer<point::reading_descriptor> timer;
    bytes = {};
    const int result = read_file(file_name, fd, vetted, bytes);
    timer.stop();
    return result;
}

namespace qz {

int lock_and_read(const char *path, const descriptor &file, const struct stat &vetted, file_bytes &bytes) {
    if (const int result = acl__lock_acl_file(path, file.get(), lock_purpose::reading); result != 0)
        return result;
    return acl__read_acl_file(path, file.get(), vetted, bytes);
}

} // namespace qz
