// The words of a line of an ACL file and their separators.
#ifndef QZACL_LINE_WORDS_H
#define QZACL_LINE_WORDS_H

#include <cctype>
#include <cstddef>

namespace qz {

constexpr bool is_blank(char c) { return c == ' ' || c == '\t' || c == '\v'; }

// White space in the process's locale. The class table is fetched once per line, because a call per byte would cost
// more than the rest of the parse.
class space_class {
public:
#ifdef __GLIBC__
    bool operator()(char c) const { return (table_[static_cast<unsigned char>(c)] & _ISspace) != 0; }

private:
    const unsigned short *table_ = *__ctype_b_loc();
#else
    bool operator()(char c) const { return std::isspace(static_cast<unsigned char>(c)) != 0; }
#endif
};

// A word in the line.
struct line_word {
    char *text = nullptr;
    std::size_t length = 0;
};

// Finds the words of one line as the parser does, but leaves the line unchanged: the parser ends each word with a NUL.
class line_words {
public:
    // `end` is at the line end or the final NUL.
    line_words(char *begin, char *end) : at_(begin), end_(end) {}

    // False when only blanks or a comment are left.
    bool next(line_word &out) {
        while (at_ != end_ && is_blank(*at_))
            ++at_;
        if (at_ == end_ || *at_ == '#')
            return false;
        out.text = at_;
        while (at_ != end_ && !is_space_(*at_))
            ++at_;
        out.length = static_cast<std::size_t>(at_ - out.text);
        // A word that ends at the line end is the last one.
        if (at_ != end_)
            ++at_;
        return true;
    }

private:
    char *at_;
    char *end_;
    space_class is_space_;
};

} // namespace qz

#endif
