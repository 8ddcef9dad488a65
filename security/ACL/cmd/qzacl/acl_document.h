// An ACL file as the verbs read it: a text, line by line with the checker's own parser, or a compiled buffer.
#ifndef QZACL_ACL_DOCUMENT_H
#define QZACL_ACL_DOCUMENT_H

#include "permission_set.h"
#include "qz/service.hpp"
#include "qzacl_acl/acl_text.h"
#include "qzacl_acl/trees.h"

#include <functional>
#include <optional>
#include <set>
#include <span>
#include <string>
#include <string_view>

namespace qzacl {

// The place of an entry in a text; all zeros for a compiled buffer.
struct text_place {
    std::size_t line = 0;  // from 1, by line feeds, as editors count
    std::size_t begin = 0; // the first byte of its line, and the one after its line end
    std::size_t end = 0;
};

// Callbacks while a file is read. The texts of an entry live as long as the document and end in NUL.
struct reading {
    std::function<void(const qz::entry_fields &, const text_place &)> entry = {};
    std::function<void(std::string_view)> whole_text = {}; // before its first line is read
    // Each entry without an identity: its type and line.
    std::function<void(std::uint8_t, std::size_t)> unnamed = {};
    bool names_file = false; // in a line before the messages, for verbs with several files
};

class acl_document {
public:
    // Reads FILE, or standard input for "-". Prints the messages of a check. Throws told_trouble if there were any,
    // or if the file cannot be read. The entries of a compiled buffer are handed out as those of a text would be.
    acl_document(const std::string &file, const permission_set &set, const reading &watched = {});

    // The same for bytes in memory; `file` is their name in answers.
    acl_document(const std::string &file, std::string_view bytes, const permission_set &set,
                 const reading &watched = {});

    const std::string &file() const { return file_; }
    bool is_compiled() const { return !compiled_.bytes().empty(); }

    // "FILE:LINE", or the file alone if the line is unknown.
    std::string place(std::size_t line) const;

    // The trees that the entries compile from. Throws if those of a buffer cannot be made.
    std::span<sec_acltree_t *const> trees();

    // What services evaluate: the buffer itself, or the compiled text; empty if there are no entries. Throws
    // recorded_trouble.
    qz::acl take_acl();

    // Throws recorded_trouble if the text has more than a buffer can hold.
    void require_compilable() const;

private:
    void read(const reading &watched);
    void read_lines(const reading &watched);
    void read_buffer(std::string_view bytes, const reading &watched);
    std::string_view kept(std::string_view mechanism);

    std::string file_;
    qz::acl_text text_;
    std::optional<sec_acltree_array> trees_;
    qz::acl compiled_;
    bool has_trees_of_buffer_ = false;
    std::set<std::string, std::less<>> mechanisms_;
    std::string_view last_mechanism_;
};

// Calls `each` with every entry of a sound buffer, sub-ACLs from last to first.
void for_each_stored(const qz::acl &acl, const std::function<void(const qz::entry_fields &)> &each);

// Appends "FILE:LINE", or the file alone if the line is 0.
void append_place(std::string &text, const std::string &file, std::size_t line);

} // namespace qzacl

#endif
