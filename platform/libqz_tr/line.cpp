// Formats a trace line as JSON. Nothing here allocates, locks, or depends on locale or time zone.
#include "libqz_tr/line.h"

#include "libqz_tr/text.h"
#include "qz/tr.h"

#include <algorithm>
#include <array>
#include <chrono>

namespace qz::tr {

// Where to write `count` more bytes, or null when they can only be counted. The second try checks the room as well,
// because an item's bytes may have changed since the first.
char *trace_line::extend(std::size_t count) {
    if (too_long_ || count > TR_LINE_LIMIT - size_) {
        too_long_ = true;
        return nullptr;
    }
    const std::size_t begin = size_;
    size_ += count;
    return fits() ? room_.data() + begin : nullptr;
}

void trace_line::put(std::string_view text) {
    if (char *to = extend(text.size()))
        std::copy(text.begin(), text.end(), to);
}

// Puts printable text between quotation marks. Only these and the backslash need escapes in JSON.
void trace_line::put_escaped(std::string_view text) {
    put("\"");
    for (const char &character : text) {
        if (character == '"' || character == '\\')
            put("\\");
        put({&character, 1});
    }
    put("\"");
}

void trace_line::put_number(long long value) {
    std::array<char, 24> digits;
    std::size_t first = digits.size();
    const auto bits = static_cast<unsigned long long>(value);
    for (auto left = value < 0 ? 0 - bits : bits; left != 0 || first == digits.size(); left /= 10)
        digits[--first] = static_cast<char>('0' + left % 10);
    if (value < 0)
        digits[--first] = '-';
    put({digits.data() + first, digits.size() - first});
}

void trace_line::put_digits(long long value, std::size_t width) {
    std::array<char, 9> digits;
    for (std::size_t place = width; place > 0; value /= 10)
        digits[--place] = static_cast<char>('0' + value % 10);
    put({digits.data(), width});
}

// Not gmtime_r: it takes the C library's time zone lock and may read files while holding it.
void trace_line::put_time(const timespec &time) {
    const std::chrono::seconds since_epoch(time.tv_sec);
    const auto days = std::chrono::floor<std::chrono::days>(since_epoch);
    const std::chrono::year_month_day date{std::chrono::sys_days(days)};
    const long long second = (since_epoch - days).count();
    put_digits(static_cast<int>(date.year()), 4);
    put("-");
    put_digits(static_cast<unsigned>(date.month()), 2);
    put("-");
    put_digits(static_cast<unsigned>(date.day()), 2);
    put("T");
    put_digits(second / 3600, 2);
    put(":");
    put_digits(second / 60 % 60, 2);
    put(":");
    put_digits(second % 60, 2);
    put(".");
    put_digits(time.tv_nsec, 9);
    put("Z");
}

void trace_line::start(const timespec &time, pid_t pid, pid_t tid, std::string_view component, int id) {
    put("{\"time\":\"");
    put_time(time);
    put("\",\"pid\":");
    put_number(pid);
    put(",\"tid\":");
    put_number(tid);
    put(",\"component\":");
    put_escaped(component);
    put(",\"id\":");
    put_number(id);
    put(",\"items\":[");
}

void trace_line::item(const void *address, std::size_t length) {
    if (address == nullptr)
        length = 0;
    // Checked before any byte is read: such a length is probably garbage.
    if (too_long_ || length > TR_LINE_LIMIT / 2) {
        too_long_ = true;
        return;
    }
    const std::string_view bytes(static_cast<const char *>(address), length);
    put(has_items_ ? ",{\"len\":" : "{\"len\":");
    has_items_ = true;
    put_number(static_cast<long long>(length));
    put(",\"hex\":\"");
    if (char *to = extend(2 * length)) {
        for (const char byte : bytes) {
            const auto value = static_cast<unsigned char>(byte);
            *to++ = "0123456789abcdef"[value >> 4];
            *to++ = "0123456789abcdef"[value & 0x0F];
        }
    }
    put("\"");
    if (!too_long_ && !bytes.empty() && bytes.back() == '\0') {
        const std::string_view text(bytes.data(), bytes.size() - 1);
        if (is_printable(text)) {
            put(",\"text\":");
            put_escaped(text);
        }
    }
    put("}");
}

void trace_line::end() { put("]}\n"); }

} // namespace qz::tr
