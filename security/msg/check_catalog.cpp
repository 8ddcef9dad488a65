// Checks a translated catalog source for gencat against the texts of the library: says FILE:LINE: for whatever would
// leave a message untranslated or its text unlike what it translates.
#include "libqz_cu/message_text.h"
#include "msg/qzseclib_msg.h"

#include <algorithm>
#include <charconv>
#include <cstdio>
#include <fstream>
#include <iterator>
#include <map>
#include <string>
#include <string_view>
#include <system_error>

namespace {

// The number that a text begins with; 0 when it begins with none or with one that fits nowhere.
int leading_number(std::string_view text) {
    int number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    return error == std::errc() ? number : 0;
}

class catalog_check {
public:
    explicit catalog_check(const char *file) : file_(file) {}

    bool run(const std::string &source) {
        std::size_t first = 1;
        std::size_t last = 0;
        std::string logical;
        for (std::size_t at = 0; at < source.size();) {
            const std::size_t end = std::min(source.find('\n', at), source.size());
            const std::string physical = source.substr(at, end - at);
            at = end + 1;
            ++last;
            // A backslash at the end of a line continues it; a pair of them is a backslash of the text.
            const std::size_t other = physical.find_last_not_of('\\');
            const std::size_t backslashes = physical.size() - (other == std::string::npos ? 0 : other + 1);
            if (backslashes % 2 != 0 && at < source.size()) {
                logical.append(physical, 0, physical.size() - 1);
                continue;
            }
            line_ = first;
            take(logical + physical);
            logical.clear();
            first = last + 1;
        }
        line_ = last;
        if (!has_set_)
            complain("there is no \"$set " + std::to_string(qz::msg::catalog_set) + "\"");
        for (const qz::msg::text_entry &entry : qz::msg::texts)
            if (!seen_.contains(entry.id))
                complain("message " + std::to_string(entry.id) + " is missing");
        return is_clean_;
    }

private:
    void complain(const std::string &what) {
        std::printf("%s:%zu: %s\n", file_, line_, what.c_str());
        is_clean_ = false;
    }

    void take(const std::string &line) {
        if (line.find_first_not_of(" \t") == std::string::npos)
            return;
        if (line.starts_with("$")) {
            take_directive(line);
        } else if (line[0] >= '0' && line[0] <= '9') {
            take_message(line);
        } else {
            complain("neither a directive nor a message");
        }
    }

    void take_directive(const std::string &line) {
        if (line.starts_with("$set ")) {
            has_set_ = true;
            if (leading_number(std::string_view(line).substr(5)) != qz::msg::catalog_set)
                complain("every message is in set " + std::to_string(qz::msg::catalog_set));
        } else if (line.starts_with("$quote")) {
            quote_ = line.size() > 7 ? line[7] : '\0';
        } else if (line.starts_with("$ codeset=")) {
            has_codeset_ = true;
        } else if (line.size() > 1 && line[1] != ' ' && line[1] != '\t') {
            complain("unknown directive");
        }
    }

    void take_message(const std::string &line) {
        const std::size_t end = std::min(line.find_first_not_of("0123456789"), line.size());
        const int id = leading_number(line);
        const std::string name = "message " + line.substr(0, end);
        const std::string_view wanted = qz::msg::default_text(id);
        if (wanted.empty())
            return complain(name + " is not one of the library's");
        if (const auto [earlier, is_new] = seen_.try_emplace(id, line_); !is_new)
            return complain(name + " stands at line " + std::to_string(earlier->second) + " already");
        std::string text;
        if (!read_text(line, end, text))
            return;
        const bool is_ascii = std::all_of(text.begin(), text.end(), [](char c) { return (c & 0x80) == 0; });
        if (!is_ascii && !has_codeset_)
            complain(name + " is not ASCII, and no \"$ codeset=\" stands before it");
        if (!qz::cu::has_conversions_of(text.c_str(), wanted.data()))
            complain(name + " does not have the conversions of the English text");
        if (!text.ends_with('\n'))
            complain(name + " does not end with a line feed (\\n)");
        // Whatever the language, the number is what people look a message up by.
        const std::string_view number = wanted.substr(0, wanted.find(' ') + 1);
        if (number.starts_with("3417-") && !text.starts_with(number))
            complain(name + " does not begin with its number " + std::string(number));
    }

    // The text as gencat reads it, which begins behind one blank.
    bool read_text(const std::string &line, std::size_t at, std::string &text) {
        if (at == line.size() || (line[at] != ' ' && line[at] != '\t')) {
            complain("a blank and a text must follow the id");
            return false;
        }
        ++at;
        const bool is_quoted = quote_ != '\0' && at < line.size() && line[at] == quote_;
        at += is_quoted ? 1 : 0;
        for (; at < line.size() && !(is_quoted && line[at] == quote_); ++at) {
            if (line[at] != '\\') {
                text += line[at];
                continue;
            }
            // Of the escapes of gencat those that a text may need.
            constexpr std::string_view letters = "nt\\\"";
            const std::size_t found = ++at < line.size() ? letters.find(line[at]) : std::string_view::npos;
            if (found == std::string_view::npos) {
                complain("an escape sequence other than \\n, \\t, \\\\ and \\\"");
                return false;
            }
            text += "\n\t\\\""[found];
        }
        if (is_quoted && at + 1 != line.size()) {
            complain(at < line.size() ? "text behind the closing quotation mark"
                                      : "no closing quotation mark");
            return false;
        }
        return true;
    }

    const char *file_;
    std::size_t line_ = 0;
    std::map<int, std::size_t> seen_; // ids and their lines
    char quote_ = '\0';
    bool has_set_ = false;
    bool has_codeset_ = false;
    bool is_clean_ = true;
};

} // namespace

int main(int argc, char **argv) {
    if (argc != 2) {
        std::fputs("usage: check_catalog FILE\n", stderr);
        return 2;
    }
    std::ifstream file(argv[1], std::ios::binary);
    const std::string source((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
    if (!file.is_open() || file.bad()) {
        std::fprintf(stderr, "check_catalog: cannot read %s\n", argv[1]);
        return 2;
    }
    return catalog_check(argv[1]).run(source) ? 0 : 1;
}
