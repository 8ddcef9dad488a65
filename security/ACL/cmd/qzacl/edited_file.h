// The file to edit: found once, together with its folder, and accessed through descriptors from then on. Its
// functions throw trouble.
#ifndef QZACL_EDITED_FILE_H
#define QZACL_EDITED_FILE_H

#include "base/owned.h"
#include "trouble.h"

#include <string>
#include <sys/stat.h>

namespace qzacl {

// An action that failed, with the reason from errno.
struct system_failure : trouble {
    explicit system_failure(const std::string &what);
};

class edited_file {
public:
    // Follows links to the real file, and opens the folder that holds it.
    explicit edited_file(const std::string &path);

    // Reads the file again. It must be a regular file with a single name: replacing one of several names would split
    // them.
    void read();

    const std::string &path() const { return path_; } // as given
    const std::string &leaf() const { return leaf_; } // its name in the folder
    int folder() const { return folder_.get(); }
    int fd() const { return file_.get(); }
    const struct stat &status() const { return status_; }
    const std::string &text() const { return text_; }

    // True if the name still leads to the file that was read, and that file has not changed since.
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
