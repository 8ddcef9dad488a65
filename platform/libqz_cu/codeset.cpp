// Code-set conversion on top of iconv. Handles are read-only after opening. The mutable part, an iconv converter with
// its shift state, exists once per thread and handle.
#include "base/kept_errno.h"
#include "base/owned.h"
#include "base/posix_fold.h"
#include "base/uncancelled.h"
#include "base/utf8.h"
#include "qz/cu.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <iconv.h>
#include <pthread.h>
#include <string_view>

struct cu_iconv {
    pthread_key_t converters; // one per thread; unused when both code sets are UTF-8
    bool from_utf8;
    bool utf8_alone; // both code sets are UTF-8: no converter is needed
    bool unmodified; // UTF-8 is not validated
    bool bmp_only;
    bool ascii_as_it_is; // pure ASCII converts to itself
    char codeset[1];     // the name; the block extends to its end
};

namespace {

using qz::kept_errno;

const iconv_t no_converter = reinterpret_cast<iconv_t>(-1);
constexpr std::size_t failed = static_cast<std::size_t>(-1);

struct result {
    qz::owned<char[]> block;
    std::size_t length = 0;

    // On failure the block is unchanged. Zero bytes get a block, too, so that null always means failure.
    bool resize(std::size_t size) { return qz::reallocate(block, std::max<std::size_t>(size, 1)); }
};

bool is_ascii(const char *in, std::size_t length) {
    std::uint64_t seen = 0;
    for (; length >= qz::word_size; in += qz::word_size, length -= qz::word_size)
        seen |= qz::load8(in);
    for (; length != 0; ++in, --length)
        seen |= static_cast<unsigned char>(*in);
    return (seen & qz::in_each_byte(0x80)) == 0;
}

// In UTF-8 exactly the characters above U+FFFF start with such a byte.
bool leaves_bmp(unsigned char lead) { return lead >= 0xf0; }

// iconv accepts surrogates, overlong forms and code points above U+10FFFF.
bool is_valid_utf8(std::string_view bytes) {
    for (std::uint32_t point = 0; !bytes.empty();) {
        if (!qz::take_utf8(bytes, point))
            return false;
    }
    return true;
}

int copy_unchanged(const char *in, std::size_t length, result &out) {
    if (!out.resize(length))
        return CU_ICONV_NO_MEMORY;
    std::memcpy(out.block.get(), in, length);
    out.length = length;
    return CU_OK;
}

int run_converter(iconv_t converter, const char *in, std::size_t in_left, result &out) {
    // Most conversions do not lengthen a string; the others grow the block.
    std::size_t size = in_left + 16;
    if (size < in_left || !out.resize(size))
        return CU_ICONV_NO_MEMORY;
    // An earlier conversion may have failed in a shifted state.
    iconv(converter, nullptr, nullptr, nullptr, nullptr);
    char *from = const_cast<char *>(in);
    for (bool ending = false;;) {
        char *to = out.block.get() + out.length;
        std::size_t to_left = size - out.length;
        const std::size_t answer = ending ? iconv(converter, nullptr, nullptr, &to, &to_left)
                                          : iconv(converter, &from, &in_left, &to, &to_left);
        out.length = size - to_left;
        if (answer == 0) {
            if (ending)
                break;
            ending = true;
        } else if (answer != failed || errno == EILSEQ || errno == EINVAL) {
            // A positive result counts characters that iconv replaced by others: a failure for us.
            return CU_ICONV_UNCONVERTIBLE;
        } else if (errno != E2BIG) {
            return CU_INTERNAL;
        } else {
            if (size > SIZE_MAX / 2 || !out.resize(size * 2))
                return CU_ICONV_NO_MEMORY;
            size *= 2;
        }
    }
    // If shrinking fails, the larger block serves.
    if (out.length != size)
        out.resize(out.length);
    return CU_OK;
}

void close_converter(void *converter) { iconv_close(converter); }

// The calling thread's converter for the handle, opened on first use.
int converter_of(const cu_iconv &handle, iconv_t &converter) {
    converter = pthread_getspecific(handle.converters);
    if (converter != nullptr)
        return CU_OK;
    const qz::uncancelled until_it_has_an_owner;
    converter = handle.from_utf8 ? iconv_open(handle.codeset, "UTF-8") : iconv_open("UTF-8", handle.codeset);
    if (converter == no_converter)
        return errno == ENOMEM   ? CU_ICONV_NO_MEMORY
               : errno == EINVAL ? CU_ICONV_UNKNOWN_CODESET
                                 : CU_NO_RESOURCE;
    if (pthread_setspecific(handle.converters, converter) != 0) {
        iconv_close(converter);
        return CU_ICONV_NO_MEMORY;
    }
    return CU_OK;
}

// All of ASCII, then one sample of each scheme that encodes other characters in ASCII: escape sequences, shifts, and
// printable marks.
struct ascii_probe {
    static constexpr char tricks[] = "\x1b$BF|\x1b(B" // as ISO-2022-JP has it
                                     "\x1b$)C\x0eF|\x0f"
                                     "~{VP~}"
                                     "+AOk-"
                                     "&AOk-";
    char bytes[128 + sizeof tricks] = {};

    constexpr ascii_probe() {
        for (unsigned i = 0; i < sizeof bytes; ++i)
            bytes[i] = i < 128 ? static_cast<char>(i) : tricks[i - 128];
    }
};
constexpr ascii_probe probe;

// Checks that the code set can be opened, and whether ASCII converts to itself.
int examine(cu_iconv &handle) {
    iconv_t converter;
    if (const int code = converter_of(handle, converter); code != CU_OK)
        return code;
    result out;
    const int code = run_converter(converter, probe.bytes, sizeof probe.bytes, out);
    if (code == CU_ICONV_NO_MEMORY)
        return code;
    handle.ascii_as_it_is = code == CU_OK && out.length == sizeof probe.bytes &&
                            std::memcmp(out.block.get(), probe.bytes, out.length) == 0;
    return CU_OK;
}

bool is_utf8(const char *codeset) {
    return qz::fold_compare(codeset, "utf-8") == 0 || qz::fold_compare(codeset, "utf8") == 0;
}

// True when the handle's restrictions allow this UTF-8, which is the input or the output of a conversion.
bool allows(const cu_iconv &handle, const char *utf8, std::size_t length) {
    return (handle.unmodified || is_valid_utf8({utf8, length})) &&
           !(handle.bmp_only && std::any_of(utf8, utf8 + length, leaves_bmp));
}

int convert_for(const cu_iconv &handle, const char *in, std::size_t length, result &out) {
    if (handle.ascii_as_it_is && is_ascii(in, length))
        return copy_unchanged(in, length, out);
    if ((handle.from_utf8 || handle.utf8_alone) && !allows(handle, in, length))
        return CU_ICONV_UNCONVERTIBLE;
    if (handle.utf8_alone)
        return copy_unchanged(in, length, out);
    iconv_t converter;
    int code = converter_of(handle, converter);
    if (code == CU_OK)
        code = run_converter(converter, in, length, out);
    if (code == CU_OK && !handle.from_utf8 && !allows(handle, out.block.get(), out.length))
        return CU_ICONV_UNCONVERTIBLE;
    // The code set was known when the handle was opened.
    return code == CU_ICONV_UNKNOWN_CODESET ? CU_NO_RESOURCE : code;
}

} // namespace

int cu_iconv_open_1(const char *codeset, uint32_t flags, cu_iconv_t *handle) {
    if (handle == nullptr)
        return CU_BAD_PARAMETER;
    *handle = nullptr;
    // iconv gives an empty name, and a suffix after a slash, a meaning beyond that of a code set.
    if (codeset == nullptr || *codeset == 0 || std::strchr(codeset, '/') != nullptr ||
        (flags & ~(CU_ICONV_FROM_UTF8 | CU_ICONV_UTF8_UNMODIFIED | CU_ICONV_BMP_ONLY)) != 0)
        return CU_BAD_PARAMETER;
    const kept_errno kept;
    const qz::uncancelled until_all_is_closed;
    const std::size_t length = std::strlen(codeset);
    qz::owned<cu_iconv> made(static_cast<cu_iconv *>(std::malloc(sizeof(cu_iconv) + length)));
    if (made == nullptr)
        return CU_ICONV_NO_MEMORY;
    const bool utf8_alone = is_utf8(codeset);
    *made = {.converters = {},
             .from_utf8 = (flags & CU_ICONV_FROM_UTF8) != 0,
             .utf8_alone = utf8_alone,
             .unmodified = utf8_alone && (flags & CU_ICONV_UTF8_UNMODIFIED) != 0,
             .bmp_only = (flags & CU_ICONV_BMP_ONLY) != 0,
             .ascii_as_it_is = utf8_alone,
             .codeset = {}};
    std::memcpy(made->codeset, codeset, length + 1);
    if (!utf8_alone) {
        if (pthread_key_create(&made->converters, close_converter) != 0)
            return CU_NO_RESOURCE;
        if (const int code = examine(*made); code != CU_OK) {
            if (void *converter = pthread_getspecific(made->converters))
                close_converter(converter);
            pthread_key_delete(made->converters);
            return code;
        }
    }
    *handle = made.release();
    return CU_OK;
}

int cu_iconv_str_1(cu_iconv_t handle, uint32_t options, const char *in, const size_t *in_length, char **out,
                   size_t *out_length) {
    if (handle == nullptr || options != 0 || in == nullptr || in_length == nullptr || out == nullptr ||
        out_length == nullptr)
        return CU_BAD_PARAMETER;
    const kept_errno kept;
    result made;
    const int code = convert_for(*handle, in, *in_length, made);
    if (code == CU_OK) {
        *out = made.block.release();
        *out_length = made.length;
    }
    return code;
}

int cu_utf8_is_assumed_1(void) { return 0; }

int cu_utf8_is_not_modified_1(void) { return 0; }

int cu_utf8_is_limited_to_bmp_1(void) { return 0; }
