// Builds one line of the trace file in a fixed amount of memory.
#ifndef QZ_TR_LINE_H
#define QZ_TR_LINE_H

#include <cstddef>
#include <ctime>
#include <span>
#include <string_view>
#include <sys/types.h>

namespace qz::tr {

// Builds the line in `room`. Bytes that do not fit are still counted, so that a first try yields the size that the
// next one needs.
class trace_line {
public:
    explicit trace_line(std::span<char> room) : room_(room) {}

    // To be called in this order: one start, any number of items, one end.
    void start(const timespec &time, pid_t pid, pid_t tid, std::string_view component, int id);
    void item(const void *address, std::size_t length);
    void end();

    // The size of the whole line, even if it does not fit.
    std::size_t size() const { return size_; }
    bool fits() const { return size_ <= room_.size(); }
    // True when the line exceeds TR_LINE_LIMIT. Then size() is meaningless.
    bool too_long() const { return too_long_; }
    std::string_view text() const { return {room_.data(), size_}; }

private:
    char *extend(std::size_t count);
    void put(std::string_view text);
    void put_escaped(std::string_view text);
    void put_number(long long value);
    void put_digits(long long value, std::size_t width);
    void put_time(const timespec &time);

    std::span<char> room_;
    std::size_t size_ = 0;
    bool too_long_ = false;
    bool has_items_ = false;
};

} // namespace qz::tr

#endif
