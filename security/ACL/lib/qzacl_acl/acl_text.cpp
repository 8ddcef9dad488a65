// The text of an ACL file: found, vetted, read whole, and handed out line by line.
#include "qzacl_acl/acl_text.h"

#include "base/open_file.h"
#include "qzacl_acl/entry_parser.h"
#include "trace_points.h"

#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <sys/stat.h>

namespace qz {

int vet_acl_file(const char *aclfname, const char *username, const acl_file_use &use, vetted_file &file) {
    std::uint32_t user_id = 0;
    if (const int result = sec__get_aclfname(aclfname, username, file.path, &user_id); result != SEC_S_OK)
        return result;
    errno = 0;
    if (stat(file.path.text, &file.status) != 0 || !S_ISREG(file.status.st_mode))
        return report(use.not_found, file.path.text, errno);
    if (username == nullptr || (use.takes_empty_of_anybody && file.status.st_size == 0))
        return SEC_S_OK;
    if (file.status.st_uid != user_id || (file.status.st_mode & (S_IWGRP | S_IWOTH)) != 0)
        return report(use.not_private, file.path.text, username);
    return SEC_S_OK;
}

namespace {

// Opens a vetted file, or the cache of a vetted text, and reads it whole.
int open_and_read(const vetted_file &file, const vetted_file *text_of_cache, const acl_file_use &use,
                  file_bytes &bytes) {
    const char *path = file.path.text;
    if (use.is_traced)
        trace(point::opening, path);
    const trace_timer<point::reading_file> reading(use.is_traced);
    const trace_timer<point::opening_file> opening(use.is_traced);
    // O_NONBLOCK: the file may be a FIFO by now.
    descriptor opened = open_file(path, O_RDONLY | O_NONBLOCK);
    if (!opened) {
        const int error = errno;
        if (use.is_traced)
            trace(point::cannot_open, path, error);
        return report(use.cannot_open, path, error);
    }
    opening.stop(path);
    if (text_of_cache != nullptr && !cache_has_entries_of_text(*text_of_cache, file, opened.get()))
        return SEC_S_ADVISORY;
    const int result = lock_and_read(path, opened, file.status, bytes);
    opened.close();
    reading.stop(path);
    return result;
}

} // namespace

int read_cache_of(const vetted_file &text, const vetted_file &cache, const acl_file_use &use,
                  file_bytes &bytes) {
    return open_and_read(cache, &text, use, bytes);
}

void acl_text::rewind() {
    cursor_ = bytes_.data.get();
    remaining_ = bytes_.length + 1;
    line_ = 1;
}

int acl_text::take(std::string_view bytes) {
    bytes_ = {};
    if (!bytes.empty()) {
        bytes_.data = allocate<char>(bytes.size() + text_padding);
        if (bytes_.data == nullptr)
            return report_no_memory("acl_text::take", bytes.size() + text_padding);
        bytes.copy(bytes_.data.get(), bytes.size());
        std::memset(bytes_.data.get() + bytes.size(), '\0', text_padding);
        bytes_.length = bytes.size();
    }
    rewind();
    return SEC_S_OK;
}

int acl_text::open(const vetted_file &file, const acl_file_use &use) {
    origin_.emplace(file.status);
    if (const int result = open_and_read(file, nullptr, use, bytes_); result != SEC_S_OK)
        return result;
    rewind();
    return SEC_S_OK;
}

acl_line acl_text::next(parsed_acle &entry) {
    result_ = sec__read_acle_from_text(set_, &cursor_, &remaining_, &line_, &entry);
    if (result_ == SEC_S_OK)
        return acl_line::end;
    if (result_ != line_consumed)
        return acl_line::bad;
    return entry.type == 0 ? acl_line::none : acl_line::entry;
}

} // namespace qz
