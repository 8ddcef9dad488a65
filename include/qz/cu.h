/*
 * The platform utility library libqz_cu: the error facility, code-set conversion, strings compared by the
 * rules of the POSIX locale, a clock, and the text of network addresses.
 *
 * ---- Rules that hold for every operation ----
 *
 * Results. An int result is a code: CU_OK (0) is success, every other value a failure named below. The three
 * string operations and the three questions about UTF-8 return their answer instead.
 *
 * Null arguments. A pointer argument must not be null. If its description says "Null: CU_BAD_PARAMETER", a
 * null pointer is rejected with that code; otherwise, unless the description allows null, passing one is an
 * error that is not detected.
 *
 * Memory. A result returned through a pointer to a pointer belongs to the caller, who releases it with the
 * operation (or the function of the C library) that the description names.
 *
 * Out-parameters. On failure, nothing that an out-parameter points to is changed unless the description says
 * otherwise.
 *
 * Side effects. No operation changes errno, prints, exits, or records an error about itself; only
 * cu_set_error_1, cu_set_no_error_1 and cu_pset_error_1 change the recorded error.
 *
 * Threads. Every operation may be called from several threads at once. An object that one thread releases
 * must not be in use in another. Nothing here may be called from a signal handler, except the string
 * operations and the questions about UTF-8.
 *
 * Forks. The child of a fork may call every operation, whatever other threads of its parent were doing: fork
 * waits until no thread holds a lock of this library. A signal handler must therefore not call fork. The child
 * has the recorded error of the thread that forked. This does not cover locks of the C library: a thread's
 * first conversion with a handle for a code set other than UTF-8 may need one.
 *
 * Cancellation. No operation is a cancellation point: one that opens a file or holds a lock disables
 * cancellation and restores its state before it returns.
 */
#ifndef QZ_CU_H
#define QZ_CU_H

#include <stddef.h>
#include <stdint.h>

#if defined(__GNUC__)
#define QZ_CU_API __attribute__((visibility("default")))
#else
#define QZ_CU_API
#endif

#ifdef __cplusplus
extern "C" {
#endif

/* Codes. The conversion of code sets has its own code for a failed allocation. */
#define CU_OK 0
#define CU_BAD_PARAMETER 4          /* an argument cannot be used */
#define CU_NO_MEMORY 6              /* an allocation failed */
#define CU_ICONV_UNCONVERTIBLE 12   /* the string holds bytes or characters that cannot be converted */
#define CU_ICONV_UNKNOWN_CODESET 13 /* the system has no conversion for the code set */
#define CU_ICONV_NO_MEMORY 15       /* an allocation failed in a conversion */
#define CU_NO_RESOURCE 17           /* the system refused a resource other than memory */
#define CU_INTERNAL 20              /* the system's converter or clock failed unexpectedly */

/*
 * ---- The error facility ----
 *
 * Each thread has one current error, initially in the no-error state. Recording an error replaces it and
 * copies the arguments without formatting them, so a failure that nobody looks at costs next to nothing. The
 * text is formatted when it is fetched.
 *
 * Message texts hold positional conversions:
 *
 *     %N$[0][width]K    N: position of the argument, 1 to 9; K: one of
 *                         s  a string (const char *), "(null)" for a null pointer
 *                         d  an int, signed decimal
 *                         u  an int, taken as unsigned, decimal
 *                         x  an int, taken as unsigned, lower-case hexadecimal
 *                         c  an int, one byte; 0 adds no byte
 *                       width: 1 to 999, padded on the left with blanks or, for d, u and x after the flag 0,
 *                       with zeros
 *     %%                a percent sign
 *
 * All other text is copied unchanged. A position may occur more than once; if it is first used as a string
 * and later as a number (or the reverse), the later conversion is copied unchanged.
 */

/* A recorded error. Only these leading fields are public; handles come only from cu_get_error_1. */
typedef struct cu_error {
    int code;       /* return code of the recorded error; 0 in the no-error state */
    int message_id; /* index into the message table; 0 in the no-error state */
} cu_error_t;

/*
 * Makes an error the calling thread's current error, replacing any earlier one.
 *
 *   code          the return code that goes with the error
 *   reserved      0; ignored
 *   catalog       name of the message catalog, as for catopen; null: no catalog. Must remain valid and
 *                 unchanged as long as the process runs (a literal), because only the pointer is kept.
 *   set           number of the message set in the catalog
 *   message_id    number of the message in the set
 *   default_text  the text if no catalog supplies one; null: empty. Must remain valid and unchanged like the
 *                 catalog's name (a literal).
 *   ...           one argument per position of the default text, in order of the positions up to the highest
 *                 one used: const char * for s, int for the others. For a position below the highest that the
 *                 text does not use, pass an int. Strings are copied; the caller need not keep them.
 *
 * Strings of any length are kept. They are truncated only if they do not fit the storage of the thread and an
 * allocation fails, too.
 *
 * Codes: CU_OK, always.
 */
QZ_CU_API int cu_set_error_1(int code, int reserved, const char *catalog, int set, int message_id,
                             const char *default_text, ...);

/* Puts the calling thread into the no-error state. Codes: CU_OK, always. */
QZ_CU_API int cu_set_no_error_1(void);

/*
 * Returns a copy of the calling thread's current error, even in the no-error state.
 *
 *   error  out: a handle, owned by the caller and released with cu_rel_error_1; later errors do not change
 *          it. Null: CU_BAD_PARAMETER.
 *
 * Codes: CU_OK; CU_BAD_PARAMETER; CU_NO_MEMORY, and then *error is null.
 */
QZ_CU_API int cu_get_error_1(cu_error_t **error);

/*
 * Formats the message text of an error: the catalog's text for its message if there is one, else the default
 * text, with the arguments inserted.
 *
 * A catalog is opened once per process, for the locale (LC_MESSAGES) that is set when its first text is
 * fetched. Its texts are not trusted: one is used only if it is not empty and has exactly the conversions of
 * the default text, in any order, and no percent sign other than "%%"; otherwise the default text is used for
 * that message. A process that fetches texts from more than eight catalogs gets the default texts of the
 * others.
 *
 *   error  the handle; it remains the caller's. Null: CU_BAD_PARAMETER.
 *   text   out: a NUL-terminated string, owned by the caller and released with cu_rel_errmsg_1; empty in the
 *          no-error state. Null: CU_BAD_PARAMETER.
 *
 * Codes: CU_OK; CU_BAD_PARAMETER, and then *text is null unless text is; CU_NO_MEMORY, and then *text is
 * null.
 */
QZ_CU_API int cu_get_errmsg_1(const cu_error_t *error, char **text);

/*
 * Makes a copy of the handle's error the calling thread's current error, or enters the no-error state if the
 * handle was obtained in that state. The handle may come from any thread.
 *
 *   error  the handle; it remains the caller's. Null: CU_BAD_PARAMETER.
 *
 * Codes: CU_OK; CU_BAD_PARAMETER. Strings are truncated as cu_set_error_1 describes.
 */
QZ_CU_API int cu_pset_error_1(const cu_error_t *error);

/* Releases a handle of cu_get_error_1. Null: nothing happens. */
QZ_CU_API void cu_rel_error_1(cu_error_t *error);

/* Releases a text of cu_get_errmsg_1. Null: nothing happens. */
QZ_CU_API void cu_rel_errmsg_1(char *text);

/*
 * ---- Code-set conversion ----
 *
 * Conversion between UTF-8 and a named code set. Open a handle once for a code set and a direction; it is
 * never closed, and any number of threads may use it at once.
 */

typedef struct cu_iconv *cu_iconv_t;

/* Flags of cu_iconv_open_1. */
#define CU_ICONV_FROM_UTF8 1u       /* from UTF-8 to the code set; without it from the code set to UTF-8 */
#define CU_ICONV_UTF8_UNMODIFIED 8u /* if the code set is UTF-8 as well, copy bytes unchanged, valid or not */
#define CU_ICONV_BMP_ONLY 32u       /* characters above U+FFFF cannot be converted, whatever the code set */

/*
 * Opens a handle.
 *
 *   codeset  name of the code set, as nl_langinfo(CODESET) gives it. Null, empty, or with a "/" in it:
 *            CU_BAD_PARAMETER. The name is copied.
 *   flags    the sum of flags above; any other bit: CU_BAD_PARAMETER
 *   handle   out: the handle, valid as long as the process runs; null after any failure. Null:
 *            CU_BAD_PARAMETER.
 *
 * Codes: CU_OK; CU_BAD_PARAMETER; CU_ICONV_UNKNOWN_CODESET if the system cannot convert in the requested
 * direction; CU_ICONV_NO_MEMORY; CU_NO_RESOURCE if the system provides no converter or has no more keys for
 * thread-specific data; CU_INTERNAL.
 */
QZ_CU_API int cu_iconv_open_1(const char *codeset, uint32_t flags, cu_iconv_t *handle);

/*
 * Converts a string as a whole. Every byte up to the length is converted, including NUL bytes: for a
 * NUL-terminated result, include the NUL in the length. The output starts and ends in the initial shift state
 * of its code set.
 *
 *   handle      the handle; any number of threads may use it. Null: CU_BAD_PARAMETER.
 *   options     0; any other value: CU_BAD_PARAMETER
 *   in          the bytes to convert. Null: CU_BAD_PARAMETER.
 *   in_length   their number. Null: CU_BAD_PARAMETER.
 *   out         out: the converted bytes, owned by the caller and released with free; never null after
 *               success, even for no bytes. Null: CU_BAD_PARAMETER.
 *   out_length  out: the number of converted bytes. Null: CU_BAD_PARAMETER.
 *
 * Codes: CU_OK; CU_BAD_PARAMETER; CU_ICONV_UNCONVERTIBLE if the bytes are invalid or end within a character,
 * the other code set lacks a character, or a flag of the handle forbids one; CU_ICONV_NO_MEMORY;
 * CU_NO_RESOURCE if the system provides no converter for the thread; CU_INTERNAL.
 */
QZ_CU_API int cu_iconv_str_1(cu_iconv_t handle, uint32_t options, const char *in, const size_t *in_length,
                             char **out, size_t *out_length);

/* Whether applications are assumed to use UTF-8 regardless of their locale: non-zero if so. Returns 0: the
 * locale decides. */
QZ_CU_API int cu_utf8_is_assumed_1(void);

/* Whether to open handles with CU_ICONV_UTF8_UNMODIFIED: non-zero if so. Returns 0: UTF-8 is checked. */
QZ_CU_API int cu_utf8_is_not_modified_1(void);

/* Whether to open handles with CU_ICONV_BMP_ONLY: non-zero if so. Returns 0: all of Unicode is converted. */
QZ_CU_API int cu_utf8_is_limited_to_bmp_1(void);

/*
 * ---- Strings by the rules of the POSIX locale ----
 *
 * Only the letters A to Z have another case, whatever the locale; all other bytes, including those above 127,
 * are compared as they are. Bytes are unsigned.
 */

/*
 * Compares two NUL-terminated strings without regard to letter case. Returns a value less than, equal to or
 * greater than 0 if the first, in lower case, sorts before, equals or sorts after the second.
 */
QZ_CU_API int cu_strcasecmp_posix_1(const char *a, const char *b);

/*
 * Compares like cu_strcasecmp_posix_1, but at most the first n bytes of each string; it reads nothing after a
 * NUL or after n bytes. Returns 0 for n = 0; the pointers may then be null.
 */
QZ_CU_API int cu_strncasecmp_posix_1(const char *a, const char *b, size_t n);

/* Returns the lower-case letter for 'A' to 'Z', and any other value of c unchanged. */
QZ_CU_API int cu_tolower_posix_1(int c);

/*
 * ---- Clock ----
 *
 * A counter that is cheap to read, and its conversion to time. The counter never runs backwards, and its
 * start has no meaning: use it to measure intervals.
 */

/* A time or an interval. The nanoseconds are 0 to 999999999. */
typedef struct cu_time {
    int64_t seconds;
    int64_t nanoseconds;
} cu_time_t;

/* The speed of the counter, opaque to all but cu_cvt_time_1. 16 bytes. */
typedef struct cu_timeinfo {
    uint64_t opaque[2];
} cu_timeinfo_t;

/*
 * Reads the counter.
 *
 *   counter  out: its value, in ticks. Null: CU_BAD_PARAMETER.
 *
 * Codes: CU_OK; CU_BAD_PARAMETER; CU_INTERNAL if the system's clock cannot be read.
 */
QZ_CU_API int cu_get_ctr_1(uint64_t *counter);

/*
 * Returns the speed of the counter. It does not change while the process runs, so one call is enough.
 *
 *   timeinfo  out: the speed, for cu_cvt_time_1. Null: CU_BAD_PARAMETER.
 *
 * Codes: CU_OK; CU_BAD_PARAMETER.
 */
QZ_CU_API int cu_get_procspeed_1(cu_timeinfo_t *timeinfo);

/*
 * Converts a counter value, or the difference of two, to time; fractions of a nanosecond are discarded.
 *
 *   counter   the value, in ticks; any value
 *   timeinfo  the result of cu_get_procspeed_1. Null, or never filled in (all zero): CU_BAD_PARAMETER.
 *   time      out: the time. Null: CU_BAD_PARAMETER.
 *
 * Codes: CU_OK; CU_BAD_PARAMETER.
 */
QZ_CU_API int cu_cvt_time_1(uint64_t counter, const cu_timeinfo_t *timeinfo, cu_time_t *time);

/*
 * ---- Network addresses ----
 */

/*
 * Writes the text of an IPv6 address: lower case, with the longest run of zero groups as "::", and a mapped
 * IPv4 address in dotted form after "::ffff:". Equal addresses give equal texts.
 *
 *   address16  the 16 bytes of the address, in network order. Null: CU_BAD_PARAMETER.
 *   out        receives the NUL-terminated text; at least 46 bytes. Null: CU_BAD_PARAMETER.
 *
 * Codes: CU_OK; CU_BAD_PARAMETER.
 */
QZ_CU_API int cu_ipaddr_ntop_1(const void *address16, char *out);

#ifdef __cplusplus
}
#endif

#endif
