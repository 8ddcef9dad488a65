// The file that an edit is about: found once, with the folder that holds it, and asked through descriptors from then
// on. Its functions throw trouble.
#ifndef QZACL_EDITED_FILE_H
#define QZACL_EDITED_FILE_H

#include "base/owned.h"
#include "trouble.h"

#include <string>
#include <sys/stat.h>

namespace qzacl {

// What could not be done, and why by errno.
struct system_failure : trouble {
    explicit system_failure(const std::string &what);
};

class edited_file {
public:
    // Follows links to the real file, and opens the folder that holds it.
    explicit edited_file(const std::string &path);

    // Reads the file anew. It is a regular one with a single name: a change of another name's file would split them.
    void read();

    const std::string &path() const { return path_; } // as it was given
    const std::string &leaf() const { return leaf_; } // its name in the folder
    int folder() const { return folder_.get(); }
    int fd() const { return file_.get(); }
    const struct stat &status() const { return status_; }
    const std::string &text() const { return text_; }

    // Whether the name still leads to the file that was read, and nothing was done to it since.
    bool is_as_read() const;

private:
    std::string path_;
    std::string leaf_;
    std::string text_;
    qz::descriptor folder_;
    qz::descriptor file_;
    struct stat status_ = {};
};

} // namespace qzacl

#endif
