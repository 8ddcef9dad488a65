/*
 * Tracing: components register their trace categories, test the level of each by reading one byte, and record
 * trace points with data in the trace file of the process.
 *
 * ---- Rules that hold for every operation ----
 *
 * Results. An int result is a code: TR_OK (0) is success, every other value a failure named below. A caller
 * that traces may ignore them all: a record that cannot be written is dropped, and nothing else happens.
 *
 * Null arguments. A pointer argument may be null only if its description says so. Otherwise null gives
 * TR_BAD_PARAMETER.
 *
 * Configuration. Two environment variables are read once per process, by its first registration (or by a
 * query before it). A privileged program (set-user-ID and the like) ignores them.
 *
 *   QZ_TRACE_LEVELS   the level, 0 to 255, of each category: "COMP:Category=8,Other=2;COMP2:Category=1".
 *                     Names are compared byte by byte, including blanks. Unnamed categories have level 0; the
 *                     last setting of a category wins; a part that cannot be parsed is skipped and the rest
 *                     is used.
 *   QZ_TRACE_FILE     the file that records are appended to. It is opened when it is first needed and stays
 *                     open. If it does not exist, it is created with mode 0600. An existing file is used only
 *                     if it is a regular file of the process's effective user, has one name (no second hard
 *                     link), and neither its mode nor an ACL lets its group or others write to it; a symbolic
 *                     link is refused. Choose a folder in which only that user can create files, such as the
 *                     service's own: elsewhere, anyone can keep the trace from being written by creating a
 *                     file of its name first.
 *
 * Without a usable file every level is 0, so that a component that tests its levels never records.
 *
 * Records. A record is one line of JSON, written by one write to a descriptor opened for appending; records
 * of several threads and processes do not mix. After a fork, the child's records have its own process id. The
 * time is UTC. An example, shown here on two lines:
 *
 *     {"time":"2026-11-24T19:05:00.123456789Z","pid":4711,"tid":4711,"component":"_SEL","id":11,
 *     "items":[{"len":11,"hex":"2f6574632f612e61636c00","text":"/etc/a.acl"}]}
 *
 * If its bytes are one NUL-terminated string of printable UTF-8, an item also has a text.
 *
 * Component names. The name of a component is a NUL-terminated string of 1 to 63 bytes of printable UTF-8. It
 * is copied: no operation keeps a pointer to a name, category table or item of the caller.
 *
 * Side effects. errno is preserved, and no signal is raised.
 *
 * Threads. Every operation may be called by any thread at any time; none may be called from a signal handler.
 * Recording takes no lock.
 *
 * Forks. The child of a fork may call every operation, whatever other threads of its parent were doing: fork
 * waits until no thread holds a lock of this library. A signal handler must therefore not call fork.
 *
 * Cancellation. No operation is a cancellation point.
 */
#ifndef QZ_TR_H
#define QZ_TR_H

#include <stddef.h>
#include <stdint.h>

#if defined(__GNUC__)
#define QZ_TR_API __attribute__((visibility("default")))
#else
#define QZ_TR_API
#endif

#ifdef __cplusplus
extern "C" {
#endif

/* Return codes. */
#define TR_OK 0             /* done */
#define TR_BAD_PARAMETER 1  /* an argument is null, negative or not a name where that is not allowed */
#define TR_NO_MEMORY 2      /* no memory for the line, or too many components */
#define TR_NOT_REGISTERED 3 /* the component is not registered */
#define TR_NO_FILE 4        /* the process has no trace file, or has closed its descriptor */
#define TR_FILE_ERROR 5     /* the whole line could not be written */
#define TR_TOO_LARGE 6      /* the line is longer than TR_LINE_LIMIT, or the file name does not fit */

/* The longest line that is written, in bytes including its line feed: 64 MiB. */
#define TR_LINE_LIMIT 67108864

/* The size in bytes of the buffer for tr_get_filename_1: a name of 256 bytes and its NUL. */
#define TR_FILENAME_SIZE 257

/* The number of different component names that a process can register. */
#define TR_COMPONENT_LIMIT 64

/* One trace category of a component. */
typedef struct tr_category {
    uintptr_t number;   /* the component's own number for it; the facility does not use it */
    const char *name;   /* as in QZ_TRACE_LEVELS; null: cannot be configured, its level is 0 */
    uintptr_t reserved; /* 0 */
} tr_category_t;

/* ---- Components ---- */

/*
 * Registers a component and writes the configured level of each of its categories. Registering a component
 * again fills the new array, which replaces the previous one; the previous one is not changed.
 *
 *   component    the component's name
 *   levels       out: array of count bytes, written in the order of the table, each by one atomic store; may
 *                be null only if count is 0. The caller keeps it valid, and only reads it, until the component
 *                is unregistered or registered with another array.
 *   categories   table of count categories, read only during the call; may be null only if count is 0
 *   count        the number of categories, 0 or more
 *
 * Codes:
 *   TR_OK              registered; also if tracing is not configured or the trace file is not usable: the
 *                      levels are 0
 *   TR_BAD_PARAMETER   component is null or not a name, count is negative, or levels or categories is null
 *                      with a count above 0; nothing was written
 *   TR_NO_MEMORY       TR_COMPONENT_LIMIT other names are already registered; the levels are 0
 */
QZ_TR_API int tr_register_component_1(const char *component, uint8_t *levels, const tr_category_t *categories,
                                      int count);

/*
 * Ends recording for a component: its levels are set to 0, and the level array is no longer used. A record
 * that another thread is making at that moment may still be written.
 *
 *   component   the component's name
 *
 * Codes:
 *   TR_OK               unregistered
 *   TR_BAD_PARAMETER    component is null
 *   TR_NOT_REGISTERED   no such component is registered
 */
QZ_TR_API int tr_unregister_component_1(const char *component);

/* ---- Records ---- */

/*
 * Records a bare trace point: a record without items. The levels are not tested; that is up to the caller.
 *
 *   component   the component's name
 *   id          the trace point number, any value
 *
 * Codes:
 *   TR_OK              the line has been written
 *   TR_BAD_PARAMETER   component is null
 *   TR_NOT_REGISTERED, TR_NO_FILE, TR_FILE_ERROR   as for tr_record_data_1
 */
QZ_TR_API int tr_record_id_1(const char *component, int id);

/*
 * Records a trace point with data. The levels are not tested; that is up to the caller. With every code except
 * TR_OK the record is lost; only TR_FILE_ERROR may leave the beginning of a line in the file.
 *
 *   component   the component's name
 *   id          the trace point number, any value
 *   count       the number of items, 0 or more
 *   ...         count pairs (const void *address, size_t length in bytes), of exactly these types. The bytes
 *               must not change during the call. A null address is recorded as an item without bytes, whatever
 *               its length.
 *
 * Codes:
 *   TR_OK               the line has been written
 *   TR_BAD_PARAMETER    component is null or count is negative; or bytes changed during the call, so that the
 *                       line outgrew its memory
 *   TR_NO_MEMORY        the line is longer than 4096 bytes and there is no memory for it
 *   TR_NOT_REGISTERED   no such component is registered
 *   TR_NO_FILE          the process has no trace file, or the program has closed its descriptor. Nothing is
 *                       written if the descriptor's number now refers to another file.
 *   TR_FILE_ERROR       the whole line could not be written: no space, a file size limit, a failing device
 *   TR_TOO_LARGE        the line would be longer than TR_LINE_LIMIT
 */
QZ_TR_API int tr_record_data_1(const char *component, int id, int count, ...);

/* ---- The trace file ---- */

/*
 * Gets the current size of the trace file.
 *
 *   size   out: the size in bytes: 4294967295 if it is that or more, 0 if there is no file
 *
 * Codes:
 *   TR_OK              *size holds the size
 *   TR_BAD_PARAMETER   size is null
 *   TR_NO_FILE         the process has no trace file, or the program has closed its descriptor
 */
QZ_TR_API int tr_get_size_1(uint32_t *size);

/*
 * Gets the name of the trace file, as given in QZ_TRACE_FILE.
 *
 *   name   out: buffer of TR_FILENAME_SIZE bytes that receives the name with its NUL; unchanged on failure
 *
 * Codes:
 *   TR_OK              *name holds the file name
 *   TR_BAD_PARAMETER   name is null
 *   TR_NO_FILE         the process has no trace file, or the program has closed its descriptor
 *   TR_TOO_LARGE       the name is longer than 256 bytes
 */
QZ_TR_API int tr_get_filename_1(char *name);

#ifdef __cplusplus
}
#endif

#endif
