// test: whether an ACL grants what a file of cases says.
#include "acl_document.h"
#include "cases.h"
#include "cli.h"
#include "entry_words.h"
#include "party.h"
#include "trouble.h"
#include "whole_file.h"

#include <set>
#include <sstream>

namespace qzacl {

namespace {

class tester {
public:
    tester(const call &call, acl_document &document)
        : call_(call), file_(call.line.words[1]), handlers_(call.line.handlers), acl_(document.take_acl()),
          order_(call.line.takes_sum ? qz::order::sum : qz::order::closest) {}

    // Checks the case in a line.
    void try_line(std::size_t number, std::string_view line) {
        try {
            const std::vector<std::string> words = words_of(line);
            if (words.empty())
                return;
            test_case tried = case_of(words);
            tried.line = number;
            try_case(tried);
        } catch (const recorded_trouble &) {
            print_message(place(number) + ": cannot be asked");
            print_recorded_error();
            ++unasked_;
        } catch (const trouble &found) {
            print_message(place(number) + ": " + found.what());
            ++unasked_;
        }
    }

    int finish() {
        if (!call_.out.is_json())
            call_.out.line(std::to_string(passed_) + " passed, " + std::to_string(failed_) + " failed");
        return unasked_ != 0 ? failed : (failed_ != 0 ? no : yes);
    }

private:
    std::string place(std::size_t line) const { return file_ + ":" + std::to_string(line); }

    void try_case(const test_case &tried) {
        const std::uint32_t wanted = call_.permissions.mask_of(tried.letters);
        std::uint32_t granted = 0;
        if (tried.is_user()) {
            const party asking(tried.mechanism, tried.identity, tried.groups);
            if (has_handler_.insert(asking.mechanism()).second)
                handlers_.register_for(asking.mechanism());
            granted = granted_to(asking);
        } else {
            granted = granted_to(party());
        }
        const bool got = (granted & wanted) == wanted;
        ++(got == tried.is_expected ? passed_ : failed_);
        if (got != tried.is_expected)
            tell_failure(tried, granted);
    }

    std::uint32_t granted_to(const party &asking) const {
        const qz::decision made = qz::granted(acl_, asking.requester(), order_);
        require(made.failed() ? made.code() : SEC_S_OK);
        return made.permissions();
    }

    // A failed case got the contrary of what it expects.
    void tell_failure(const test_case &tried, std::uint32_t granted) {
        const char *expected = tried.is_expected ? "yes" : "no";
        const char *got = tried.is_expected ? "no" : "yes";
        if (call_.out.is_json())
            return call_.out.object(json_of(tried, expected, got));
        std::string line = place(tried.line) + ": expected " + expected + ", got " + got + ": ";
        line += tried.mechanism + " " + tried.identity;
        for (const std::string &group : tried.groups)
            line += " +" + group;
        line += " " + tried.letters + " (granted:";
        const std::string_view letters = call_.permissions.letters_of(granted);
        line.append(letters.empty() ? "" : " ").append(letters).append(")");
        call_.out.line(line);
    }

    json json_of(const test_case &tried, const char *expected, const char *got) const {
        json object;
        object["file"] = json_text(file_);
        object["line"] = tried.line;
        object["mechanism"] = tried.is_user() ? json_text(tried.mechanism) : json();
        object["identity"] = tried.is_user() ? json_text(tried.identity) : json();
        object["groups"] = json::array();
        for (const std::string &group : tried.groups)
            object["groups"].push_back(json_text(group));
        object["permissions"] = json_text(tried.letters);
        object["expected"] = expected;
        object["got"] = got;
        return object;
    }

    const call &call_;
    std::string file_;
    handlers handlers_;
    std::set<std::string> has_handler_;
    qz::acl acl_;
    qz::order order_;
    std::size_t passed_ = 0;
    std::size_t failed_ = 0;
    std::size_t unasked_ = 0;
};

} // namespace

int test(const call &call) {
    acl_document document(call.line.words[0], call.permissions, {.names_file = true});
    tester testing(call, document);
    std::istringstream lines(read_whole(call.line.words[1]));
    std::string line;
    for (std::size_t number = 1; std::getline(lines, line); ++number)
        testing.try_line(number, line);
    return testing.finish();
}

} // namespace qzacl
