// The text of an ACL file: found and vetted, read whole, and handed out line after line.
#ifndef QZACL_ACL_TEXT_H
#define QZACL_ACL_TEXT_H

#include "qz/acl.h"
#include "qzacl_acl/cache_file.h"
#include "qzacl_acl/file_name.h"
#include "qzacl_utils.h"
#include "report.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

namespace qz {

// Where those who read ACL files differ.
struct acl_file_use {
    failure_kind<const char *, int>
        not_found; // with the path and an error number, 0 for what is no regular file
    failure_kind<const char *, const char *> not_private; // with the path and the user
    failure_kind<const char *, int> cannot_open;          // with the path and an error number
    bool takes_empty_of_anybody; // an empty file grants nothing, whoever may write it
    bool is_traced;              // opening and its times
};

// Finds the file and examines it: a regular one, and with a user name that user's, whom alone it lets write.
// Returns SEC_S_OK, a code of sec__get_aclfname, or one of the use.
int vet_acl_file(const char *aclfname, const char *username, const acl_file_use &use, vetted_file &file);

// Opens the current cache of a vetted text and reads it whole. Returns SEC_S_OK, SEC_S_FILE_ERROR or
// SEC_S_NO_MEMORY; or SEC_S_ADVISORY, without an error, when its POSIX ACL has other entries than the text's.
int read_cache_of(const vetted_file &text, const vetted_file &cache, const acl_file_use &use,
                  file_bytes &bytes);

// What a line of the text holds.
enum class acl_line {
    none,  // a blank, or a comment
    entry, // an entry
    bad,   // neither, and the failure was recorded
    end,   // there is no further line
};

class acl_text {
public:
    // A null set means the default templates.
    explicit acl_text(const sec_perm_set_t *set) : set_(set) {}

    // Runs `attempt`, which vets a file and opens it here, and again when another file took its place between
    // the two: whoever replaces a file by rename must not make its reading fail. Returns what the last attempt
    // did.
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

    // Reads the file, and stands before its first line. Returns SEC_S_OK, SEC_S_FILE_ERROR or SEC_S_NO_MEMORY.
    int open(const vetted_file &file, const acl_file_use &use);

    // Takes a copy of bytes that come from elsewhere, such as standard input, and stands before their first line.
    // Returns SEC_S_OK or SEC_S_NO_MEMORY.
    int take(std::string_view bytes);

    // Reads the next line into the entry, whose identity points into the text. A bad line does not keep those
    // that follow from being read.
    acl_line next(sec_acle_t &entry);

    bool is_empty() const { return bytes_.length == 0; }
    // The text from the line that comes next on. Of the lines before it the reader has overwritten bytes.
    std::string_view unread() const {
        return cursor_ == nullptr ? std::string_view() : std::string_view(cursor_, remaining_ - 1);
    }
    // The number of the line that comes next, from 1.
    std::uint32_t line() const { return line_; }
    // The code of the bad line that was read last.
    int failure() const { return result_; }
    // What a cache of the text must be made with; once it is open.
    const text_origin &origin() const { return *origin_; }

private:
    void stand_before_first_line();

    const sec_perm_set_t *set_;
    std::optional<text_origin> origin_;
    file_bytes bytes_;
    char *cursor_ = nullptr;
    std::size_t remaining_ = 0; // from the cursor on, with the NUL behind the text
    std::uint32_t line_ = 1;
    int result_ = SEC_S_OK;
};

} // namespace qz

#endif
