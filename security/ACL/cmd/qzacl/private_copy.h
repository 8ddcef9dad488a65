// A copy of a text for an editor, in a folder that no other user can read.
#ifndef QZACL_PRIVATE_COPY_H
#define QZACL_PRIVATE_COPY_H

#include <string>
#include <string_view>

namespace qzacl {

// A folder below $TMPDIR or else /tmp. It is removed with everything that an editor left in it.
class private_folder {
public:
    private_folder();
    private_folder(const private_folder &) = delete;
    private_folder &operator=(const private_folder &) = delete;
    ~private_folder();

    const std::string &path() const { return path_; }

private:
    std::string path_;
};

class private_copy {
public:
    // The copy has the given name. Throws trouble.
    private_copy(const std::string &name, std::string_view text);

    // Runs $VISUAL, else $EDITOR, else the usual editor on the copy. Throws trouble when it fails.
    void edit() const;

    // The text as the editor left it. Throws trouble.
    std::string text() const;

private:
    private_folder folder_;
    std::string path_;
};

} // namespace qzacl

#endif
