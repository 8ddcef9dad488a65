// Message texts: parsing, comparing and applying their positional conversions.
#include "libqz_cu/message_text.h"

#include <algorithm>
#include <cstring>

namespace qz::cu {
namespace {

// One conversion, in the form "%N$[0][width]K".
struct conversion {
    unsigned index; // position - 1
    bool zeros;
    unsigned width;
    char kind;
    std::size_t length; // in the text

    bool is_string() const { return kind == 's'; }
    bool operator==(const conversion &) const = default;
};

bool is_digit(char c) { return c >= '0' && c <= '9'; }

// Reads the conversion at a percent sign. False when there is none.
bool read_conversion(const char *percent, conversion &found) {
    const char *at = percent + 1;
    if (*at < '1' || *at > '9' || at[1] != '$')
        return false;
    found.index = static_cast<unsigned>(*at - '1');
    at += 2;
    found.zeros = *at == '0';
    if (found.zeros)
        ++at;
    found.width = 0;
    for (unsigned digits = 0; digits < 3 && is_digit(*at) && (digits > 0 || *at != '0'); ++digits, ++at)
        found.width = found.width * 10 + static_cast<unsigned>(*at - '0');
    if (*at != 's' && *at != 'd' && *at != 'u' && *at != 'x' && *at != 'c')
        return false;
    found.kind = *at;
    found.length = static_cast<std::size_t>(at + 1 - percent);
    return true;
}

// Counts all bytes put, and writes the parts that end within the room.
class sink {
public:
    sink(char *out, std::size_t room) : out_(out), room_(room) {}

    void put(const char *bytes, std::size_t count) {
        if (has_room(count))
            std::memcpy(out_ + length_, bytes, count);
        length_ += count;
    }

    void fill(char byte, std::size_t count) {
        if (has_room(count))
            std::memset(out_ + length_, byte, count);
        length_ += count;
    }

    std::size_t length() const { return length_; }

private:
    bool has_room(std::size_t count) const {
        return count != 0 && length_ <= room_ && count <= room_ - length_;
    }

    char *out_;
    std::size_t room_;
    std::size_t length_ = 0;
};

// A value as shown, without padding.
struct shown {
    const char *sign = "";
    const char *bytes = nullptr;
    std::size_t count = 0;
};

shown show_digits(unsigned value, unsigned base, char *end) {
    shown digits{.bytes = end};
    do {
        *--end = "0123456789abcdef"[value % base];
        ++digits.count;
        value /= base;
    } while (value != 0);
    digits.bytes = end;
    return digits;
}

void put_value(sink &to, const conversion &how, const arguments::value &value) {
    char room[16];
    shown what;
    if (how.is_string()) {
        what.bytes = value.text != nullptr ? value.text : "(null)";
        what.count = std::strlen(what.bytes);
    } else if (how.kind == 'c') {
        room[0] = static_cast<char>(value.number);
        what.bytes = room;
        what.count = room[0] != 0 ? 1 : 0;
    } else {
        const bool negative = how.kind == 'd' && value.number < 0;
        const auto bits = static_cast<unsigned>(value.number);
        what = show_digits(negative ? 0u - bits : bits, how.kind == 'x' ? 16 : 10, room + sizeof room);
        what.sign = negative ? "-" : "";
    }

    const std::size_t sign = std::strlen(what.sign);
    const std::size_t taken = sign + what.count;
    const std::size_t filling = how.width > taken ? how.width - taken : 0;
    const bool zeros = how.zeros && !how.is_string() && how.kind != 'c';
    to.fill(' ', zeros ? 0 : filling);
    to.put(what.sign, sign);
    to.fill('0', zeros ? filling : 0);
    to.put(what.bytes, what.count);
}

// The conversions of a text, for comparison. A text with too many of them is not trusted.
struct conversion_list {
    static constexpr unsigned capacity = 32;

    conversion items[capacity];
    unsigned count = 0;
    bool well_formed = true;

    explicit conversion_list(const char *text) {
        for (const char *at = std::strchr(text, '%'); at != nullptr; at = std::strchr(at, '%')) {
            if (at[1] == '%') {
                at += 2;
            } else if (count < capacity && read_conversion(at, items[count])) {
                at += items[count++].length;
            } else {
                well_formed = false;
                return;
            }
        }
    }
};

} // namespace

void find_arguments(const char *text, arguments &found) {
    unsigned count = 0;
    unsigned seen = 0;
    unsigned strings = 0;
    conversion next;
    for (const char *at = std::strchr(text, '%'); at != nullptr; at = std::strchr(at, '%')) {
        if (read_conversion(at, next)) {
            const unsigned bit = 1u << next.index;
            if ((seen & bit) == 0 && next.is_string())
                strings |= bit;
            seen |= bit;
            count = std::max(count, next.index + 1);
            at += next.length;
        } else {
            at += at[1] == '%' ? 2 : 1;
        }
    }
    found.count = static_cast<std::uint16_t>(count);
    found.strings = static_cast<std::uint16_t>(strings);
}

bool has_conversions_of(const char *text, const char *default_text) {
    const conversion_list offered(text);
    conversion_list wanted(default_text);
    if (!offered.well_formed || !wanted.well_formed || offered.count != wanted.count)
        return false;
    for (unsigned i = 0; i < offered.count; ++i) {
        // Each match is removed, so that a repeated conversion must be repeated, too.
        conversion *end = wanted.items + wanted.count;
        conversion *match = std::find(wanted.items, end, offered.items[i]);
        if (match == end)
            return false;
        *match = wanted.items[--wanted.count];
    }
    return true;
}

std::size_t format_text(const char *text, const arguments &given, char *out, std::size_t room) {
    sink to(out, room);
    conversion next;
    for (;;) {
        const char *percent = strchrnul(text, '%');
        to.put(text, static_cast<std::size_t>(percent - text));
        text = percent;
        if (*percent == '\0')
            break;
        if (percent[1] == '%') {
            to.put("%", 1);
            text += 2;
        } else if (read_conversion(percent, next) && next.index < given.count &&
                   next.is_string() == given.is_string(next.index)) {
            put_value(to, next, given.values[next.index]);
            text += next.length;
        } else {
            to.put("%", 1);
            text += 1;
        }
    }
    to.put("", 1);
    return to.length();
}

} // namespace qz::cu
