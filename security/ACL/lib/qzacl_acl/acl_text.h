// The text of an ACL file: found, vetted, read whole, and handed out line by line.
#ifndef QZACL_ACL_TEXT_H
#define QZACL_ACL_TEXT_H

#include "qz/acl.h"
#include "qzacl_acl/cache_file.h"
#include "qzacl_acl/entry_parser.h"
#include "qzacl_acl/file_name.h"
#include "qzacl_utils/file_bytes.h"
#include "report.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

namespace qz {

// What differs between the readers of ACL files.
struct acl_file_use {
    failure_kind<const char *, int> not_found;            // with the path and errno, 0 for no regular file
    failure_kind<const char *, const char *> not_private; // with the path and the user
    failure_kind<const char *, int> cannot_open;          // with the path and errno
    bool takes_empty_of_anybody; // an empty file grants nothing, so its owner and mode do not matter
    bool is_traced;              // opening and its timings
};

// The use of the commands.
inline constexpr acl_file_use by_commands = {
    .not_found = {SEC_S_BAD_FILENAME, msg::bad_acl_file_name},
    .not_private = {SEC_S_BAD_PERMISSION, msg::acl_file_not_private},
    .cannot_open = {SEC_S_FILE_ERROR, msg::cannot_open_acl_file},
    .takes_empty_of_anybody = false,
    .is_traced = false,
};

// Finds and examines the file. It must be a regular file and, with a user name, owned by that user and writable by no
// one else. Returns SEC_S_OK, a code of sec__get_aclfname, or one of the use.
int vet_acl_file(const char *aclfname, const char *username, const acl_file_use &use, vetted_file &file);

// Opens the current cache of a vetted text and reads it whole. Returns SEC_S_OK, SEC_S_FILE_ERROR or SEC_S_NO_MEMORY;
// or SEC_S_ADVISORY, without an error, when its POSIX ACL differs from the text's.
int read_cache_of(const vetted_file &text, const vetted_file &cache, const acl_file_use &use,
                  file_bytes &bytes);

// What a line of the text holds.
enum class acl_line {
    none,  // nothing but blanks and a comment
    entry, // an entry
    bad,   // an error, which was recorded
    end,   // no further line
};

class acl_text {
public:
    // A null set means the default templates.
    explicit acl_text(const sec_perm_set_t *set) : set_(set) {}

    // Runs `attempt`, which vets a file and opens it here, and repeats it when the file was replaced in between:
    // replacing a file by rename must not make reading it fail. Returns the result of the last attempt.
    template <class Attempt>
    int open_again_while_replaced(const Attempt &attempt) {
        constexpr int most_attempts = 50;
        for (int left = most_attempts;; --left) {
            bytes_.is_replaced = false;
            const int result = attempt();
            if (!bytes_.is_replaced || left == 1)
                return result;
            cu_set_no_error_1();
        }
    }

    // Reads the file and rewinds to its first line. Returns SEC_S_OK, SEC_S_FILE_ERROR or SEC_S_NO_MEMORY.
    int open(const vetted_file &file, const acl_file_use &use);

    // Copies bytes from another source, such as standard input, and rewinds to their first line. Returns SEC_S_OK or
    // SEC_S_NO_MEMORY.
    int take(std::string_view bytes);

    // Reads the next line into the entry, which points into the text. Reading can go on after a bad line.
    acl_line next(parsed_acle &entry);

    bool is_empty() const { return bytes_.length == 0; }
    // The whole text with its NUL, for trees that point into it.
    std::span<char> all() const { return bytes_.all(); }
    // The text from the next line on. In the lines before it the reader has overwritten bytes.
    std::string_view unread() const {
        return cursor_ == nullptr ? std::string_view() : std::string_view(cursor_, remaining_ - 1);
    }
    // The number of the next line, from 1.
    std::uint32_t line() const { return line_; }
    // The code of the last bad line.
    int failure() const { return result_; }
    // Where the text comes from, for writing its cache. Only after open().
    const text_origin &origin() const { return *origin_; }

private:
    void rewind();

    const sec_perm_set_t *set_;
    std::optional<text_origin> origin_;
    file_bytes bytes_;
    char *cursor_ = nullptr;
    std::size_t remaining_ = 0; // from the cursor on, including the final NUL
    std::uint32_t line_ = 1;
    int result_ = SEC_S_OK;
};

} // namespace qz

#endif
