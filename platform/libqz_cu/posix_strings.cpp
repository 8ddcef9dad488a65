// String functions of the POSIX locale.
#include "base/posix_fold.h"
#include "qz/cu.h"

int cu_strcasecmp_posix_1(const char *a, const char *b) { return qz::fold_compare(a, b); }

int cu_strncasecmp_posix_1(const char *a, const char *b, size_t n) {
    for (; n != 0; ++a, ++b, --n) {
        const unsigned char left = qz::fold(static_cast<unsigned char>(*a));
        const unsigned char right = qz::fold(static_cast<unsigned char>(*b));
        if (left != right)
            return left - right;
        if (left == 0)
            break;
    }
    return 0;
}

int cu_tolower_posix_1(int c) { return c >= 'A' && c <= 'Z' ? c + ('a' - 'A') : c; }
