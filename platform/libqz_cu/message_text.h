// Message texts and their positional conversions: which arguments a text takes, whether two texts take the same ones,
// and formatting. No text ever becomes a printf format.
#ifndef QZ_CU_MESSAGE_TEXT_H
#define QZ_CU_MESSAGE_TEXT_H

#include <cstddef>
#include <cstdint>

namespace qz::cu {

inline constexpr unsigned max_arguments = 9;

// The arguments of a text by position. A position holds a number unless its bit in `strings` is set.
struct arguments {
    union value {
        const char *text;
        int number;
    };

    std::uint16_t count;   // the highest position that the text uses
    std::uint16_t strings; // bit i: position i + 1 is a string
    value values[max_arguments];

    bool is_string(unsigned index) const { return ((strings >> index) & 1) != 0; }
};

// Sets `count` and `strings` to the arguments that the text takes. The caller sets the values.
void find_arguments(const char *text, arguments &found);

// True when a text is well formed and has exactly the conversions of the default text, in any order.
bool has_conversions_of(const char *text, const char *default_text);

// Writes the formatted text and a NUL to `out` and returns their size. If that exceeds `room`, the output is
// incomplete, but nothing is written beyond it.
std::size_t format_text(const char *text, const arguments &given, char *out, std::size_t room);

} // namespace qz::cu

#endif
