// A file of cases: what an ACL must grant, and what it must not.
#ifndef QZACL_CASES_H
#define QZACL_CASES_H

#include <string>
#include <string_view>
#include <vector>

namespace qzacl {

// "MECHANISM IDENTITY [+GROUP]... LETTERS yes|no"; "-" for both names is the unauthenticated party.
struct test_case {
    std::size_t line = 0; // from 1, by line feeds
    std::string mechanism;
    std::string identity;
    std::vector<std::string> groups;
    std::string letters;
    bool is_expected = false;

    bool is_user() const { return mechanism != "-" || identity != "-"; }
};

// Reads a case from the words of a line that is not empty. Throws trouble.
test_case case_of(const std::vector<std::string> &words);

// The words of a line of an ACL file or a file of cases, without its comment.
std::vector<std::string> words_of(std::string_view line);

} // namespace qzacl

#endif
