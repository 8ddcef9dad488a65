// One line of the trace file in the making, within memory of a fixed size.
#ifndef QZ_TR_LINE_H
#define QZ_TR_LINE_H

#include <cstddef>
#include <ctime>
#include <span>
#include <string_view>
#include <sys/types.h>

namespace qz::tr {

// Collects the line in `room`. What does not fit is counted all the same, so that a first try tells
// the size that the next one needs.
class trace_line {
public:
    explicit trace_line(std::span<char> room) : room_(room) {}

    // The line's parts, in this order: one start, any number of items, one end.
    void start(const timespec &time, pid_t pid, pid_t tid, std::string_view component, int id);
    void item(const void *address, std::size_t length);
    void end();

    // The size of the whole line, whether it fitted or not.
    std::size_t size() const { return size_; }
    bool fits() const { return size_ <= room_.size(); }
    // Longer than a line may be; size() is not to be trusted then.
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
