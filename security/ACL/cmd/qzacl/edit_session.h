// An editor on an ACL file: a text with mistakes never replaces it, and no change of others is lost.
#ifndef QZACL_EDIT_SESSION_H
#define QZACL_EDIT_SESSION_H

#include "edited_file.h"
#include "noted_signals.h"
#include "permission_set.h"
#include "private_copy.h"

#include <chrono>
#include <string>

namespace qzacl {

class edit_session {
public:
    edit_session(edited_file &file, const permission_set &set, std::chrono::seconds wait); // throws trouble

    // Runs the editor until its text is written; throws trouble if the user gives up. False if the text is unchanged.
    bool run();

private:
    bool is_right(const std::string &text) const;
    bool write(const std::string &text);
    bool asks_to_go_on(const std::string &text) const;

    edited_file &file_;
    const permission_set &set_;
    std::chrono::seconds wait_;
    std::string base_; // the text that the editor started from
    noted_signals signals_;
    private_copy copy_;
};

} // namespace qzacl

#endif
