// The one reader of foreign bytes and the one writer of our own. Both step through byte_cursor, which checks "wanted <=
// left". Lengths are never added, so nothing can wrap.
#ifndef QZ_BYTES_H
#define QZ_BYTES_H

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>

namespace qz {

using byte_span = std::span<const unsigned char>;

// Steps over bytes from start to end. A step that does not fit moves nothing and returns false.
template <class Byte>
class byte_cursor {
public:
    byte_cursor() = default;
    explicit byte_cursor(std::span<Byte> bytes) : at_(bytes.data()), end_(bytes.data() + bytes.size()) {}

    std::size_t left() const { return static_cast<std::size_t>(end_ - at_); }
    Byte *position() const { return at_; }

    // Steps over `count` bytes and hands out their start.
    bool take(std::size_t count, Byte *&start) {
        if (count > left())
            return false;
        start = at_;
        at_ += count;
        return true;
    }

    bool skip(std::size_t count) {
        Byte *skipped = nullptr;
        return take(count, skipped);
    }

private:
    Byte *at_ = nullptr;
    Byte *end_ = nullptr;
};

class byte_reader : public byte_cursor<const unsigned char> {
public:
    using byte_cursor::byte_cursor;

    bool bytes(std::size_t count, byte_span &out) {
        const unsigned char *start = nullptr;
        if (!take(count, start))
            return false;
        out = byte_span(start, count);
        return true;
    }

    // An unsigned field in host byte order, at any address.
    template <class Field>
    bool field(Field &out) {
        const unsigned char *start = nullptr;
        if (!take(sizeof(Field), start))
            return false;
        std::memcpy(&out, start, sizeof(Field));
        return true;
    }
};

// Walks over bytes of the other byte order and converts fields to host order in place.
class byte_swapper : public byte_cursor<unsigned char> {
public:
    using byte_cursor::byte_cursor;

    // A single byte needs no conversion.
    bool byte(std::uint8_t &out) {
        unsigned char *start = nullptr;
        if (!take(sizeof out, start))
            return false;
        out = *start;
        return true;
    }

    // Converts a field and hands out its value.
    template <class Field>
    bool swap(Field &out) {
        unsigned char *start = nullptr;
        if (!take(sizeof(Field), start))
            return false;
        std::reverse(start, start + sizeof(Field));
        std::memcpy(&out, start, sizeof(Field));
        return true;
    }
};

// Fills memory that was measured beforehand. A write that does not fit is dropped and recorded as a failure.
class byte_writer {
public:
    explicit byte_writer(std::span<unsigned char> memory) : free_(memory) {}

    std::size_t left() const { return free_.left(); }
    // True when exactly the measured size was written.
    bool is_full() const { return !failed_ && free_.left() == 0; }

    void bytes(const void *source, std::size_t count) {
        unsigned char *start = nullptr;
        if (!free_.take(count, start))
            failed_ = true;
        else if (count != 0) // the source of nothing may be null
            std::memcpy(start, source, count);
    }

    template <class Field>
    void field(Field value) {
        bytes(&value, sizeof value);
    }

private:
    byte_cursor<unsigned char> free_;
    bool failed_ = false;
};

// The place of a field whose offset a reader found or the format fixes. An offset out of bounds is a bug: the process
// is stopped, because otherwise it would decide by bytes that nobody wrote.
template <class Field, class Byte>
Byte *proven_place(std::span<Byte> bytes, std::size_t offset) {
    byte_cursor<Byte> cursor(bytes);
    Byte *place = nullptr;
    if (!cursor.skip(offset) || !cursor.take(sizeof(Field), place))
        __builtin_trap();
    return place;
}

// A field in host byte order at a proven offset.
template <class Field>
Field load_field(byte_span bytes, std::size_t offset) {
    Field value;
    std::memcpy(&value, proven_place<Field>(bytes, offset), sizeof value);
    return value;
}

template <class Field>
void store_field(std::span<unsigned char> bytes, std::size_t offset, Field value) {
    std::memcpy(proven_place<Field>(bytes, offset), &value, sizeof value);
}

} // namespace qz

#endif
