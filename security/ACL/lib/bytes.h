// The one reader of bytes that somebody else made and the one writer of ours. Every step of the reader is
// checked as "wanted is at most what is left"; nothing adds two lengths and hopes.
#ifndef QZ_BYTES_H
#define QZ_BYTES_H

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>

namespace qz {

using byte_span = std::span<const unsigned char>;

// Walks over a span. A step that does not fit takes nothing and returns false.
class byte_reader {
public:
    byte_reader() = default;
    explicit byte_reader(byte_span bytes) : at_(bytes.data()), end_(bytes.data() + bytes.size()) {}

    std::size_t left() const { return static_cast<std::size_t>(end_ - at_); }
    const unsigned char *position() const { return at_; }

    bool skip(std::size_t count) {
        if (count > left())
            return false;
        at_ += count;
        return true;
    }

    bool bytes(std::size_t count, byte_span &out) {
        if (count > left())
            return false;
        out = byte_span(at_, count);
        at_ += count;
        return true;
    }

    // An unsigned field in host byte order, at any address.
    template <class Field>
    bool field(Field &out) {
        if (sizeof(Field) > left())
            return false;
        std::memcpy(&out, at_, sizeof(Field));
        at_ += sizeof(Field);
        return true;
    }

private:
    const unsigned char *at_ = nullptr;
    const unsigned char *end_ = nullptr;
};

// A field in host byte order at an offset that the format fixes, inside bytes that were read as one piece.
template <class Field>
Field load_field(byte_span bytes, std::size_t offset) {
    Field value = 0;
    if (offset <= bytes.size() && sizeof(Field) <= bytes.size() - offset)
        std::memcpy(&value, bytes.data() + offset, sizeof value);
    return value;
}

// Walks over bytes of the other byte order, turning each field it is asked for into host order in place.
class byte_swapper {
public:
    explicit byte_swapper(std::span<unsigned char> bytes)
        : at_(bytes.data()), end_(bytes.data() + bytes.size()) {}

    const unsigned char *position() const { return at_; }

    bool skip(std::size_t count) {
        if (count > static_cast<std::size_t>(end_ - at_))
            return false;
        at_ += count;
        return true;
    }

    // A byte, which has no order.
    bool byte(std::uint8_t &out) {
        if (at_ == end_)
            return false;
        out = *at_++;
        return true;
    }

    // Swaps a field and hands out its value in host order.
    template <class Field>
    bool swap(Field &out) {
        if (sizeof(Field) > static_cast<std::size_t>(end_ - at_))
            return false;
        std::reverse(at_, at_ + sizeof(Field));
        std::memcpy(&out, at_, sizeof(Field));
        at_ += sizeof(Field);
        return true;
    }

private:
    unsigned char *at_;
    unsigned char *end_;
};

// Fills memory that was measured beforehand; what would not fit is not written and makes the writer failed.
class byte_writer {
public:
    explicit byte_writer(std::span<unsigned char> memory)
        : at_(memory.data()), end_(memory.data() + memory.size()) {}

    std::size_t left() const { return static_cast<std::size_t>(end_ - at_); }
    // True when exactly the measured size was written.
    bool is_full() const { return !failed_ && at_ == end_; }

    void bytes(const void *source, std::size_t count) {
        if (count > left()) {
            failed_ = true;
            return;
        }
        if (count != 0) // what is absent has no address
            std::memcpy(at_, source, count);
        at_ += count;
    }

    template <class Field>
    void field(Field value) {
        bytes(&value, sizeof value);
    }

private:
    unsigned char *at_;
    unsigned char *end_;
    bool failed_ = false;
};

// A field in host byte order at an offset that was found by a reader or fixed by the format, over bytes that
// are held writable.
template <class Field>
void store_field(std::span<unsigned char> bytes, std::size_t offset, Field value) {
    if (offset <= bytes.size() && sizeof(Field) <= bytes.size() - offset)
        std::memcpy(bytes.data() + offset, &value, sizeof value);
}

} // namespace qz

#endif
