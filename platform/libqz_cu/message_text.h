// Message texts and their positional conversions: which arguments a text takes, whether two texts take the
// same, and the text with the arguments put in. No text, wherever it is from, becomes the format of a printf.
#ifndef QZ_CU_MESSAGE_TEXT_H
#define QZ_CU_MESSAGE_TEXT_H

#include <cstddef>
#include <cstdint>

namespace qz::cu {

inline constexpr unsigned max_arguments = 9;

// The arguments of a text by position. A position of which no bit is set in `strings` holds a number.
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

// Sets `count` and `strings` to what the text takes; the values are left to the caller.
void find_arguments(const char *text, arguments &found);

// Whether a text holds exactly the conversions of the default text, in any order, and is well formed besides.
bool has_conversions_of(const char *text, const char *default_text);

// Writes the text with the arguments put in and a final NUL to `out`, and returns the bytes of that. Where
// there is less room, nothing is written beyond it, and what was written is of no use.
std::size_t format_text(const char *text, const arguments &given, char *out, std::size_t room);

} // namespace qz::cu

#endif
