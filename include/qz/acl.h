/*
 * Access control lists: reading, listing, editing and evaluating them.
 *
 * A service registers identity handlers for its mechanisms (sec__register_id_handler), reads an ACL file
 * into a buffer (sec_read_acl_file), asks what a requester may do (sec__single_acle_perm,
 * sec__group_acles_perm), and lists or edits the buffer's entries. It releases the buffer with
 * sec_release_acl.
 *
 * ---- Rules that hold for every operation ----
 *
 * Results. An int result is a code SEC_S_...; SEC_S_OK (0) is success. A failing operation records an error
 * for the calling thread: the code and a numbered message. Fetch them with cu_get_error_1 and
 * cu_get_errmsg_1 of <qz/cu.h>. Below, "42 (3417-110)" means code 42 with the message of that number. Only
 * the dumps print.
 *
 * The recorded error on entry. Most operations first clear the thread's recorded error, so that none is
 * recorded after success; their descriptions say so. The others leave an earlier error in place when they
 * succeed.
 *
 * Null arguments. A pointer argument may be null only if its description says so. Otherwise null gives
 * 4 (3417-101), which shows the operation's name, the argument's position (from 1) and the value 0.
 * Strings end with a NUL. The void operations accept null and then do nothing.
 *
 * Memory. Any operation that allocates can fail with 6 (3417-102), which shows a function's name and the
 * number of bytes; the descriptions below list the code without the message. Results belong to the caller:
 *   - the bytes of a buffer: sec_release_acl
 *   - an entry that sec_create_acle made: sec_release_acle
 *   - the entries of a list: sec_release_aclelist
 *   - texts from sec_display_acle_id: free
 * Arguments that are kept are copied, and no result points into an argument.
 * Even an operation that allocates nothing may take memory in three cases, none of which can make it fail:
 *   - when the first operation of a process reads the trace configuration
 *   - for a trace record of more than 4096 bytes
 *   - for a failure whose texts exceed 510 bytes together, such as the denial of a very long identity; without
 *     memory the texts are cut
 *
 * Out-parameters. Their previous value is overwritten, not released. After a failure they are null or zeros
 * unless the description says otherwise.
 *
 * Code sets. Entries and buffers hold UTF-8. sec_create_acle and sec_display_acle_id convert between UTF-8
 * and the code set of the locale that was set when the process first converted in that direction; call
 * setlocale before. Mechanisms and identities are compared without regard to the case of A to Z; all other
 * bytes must be equal.
 *
 * Byte order. A buffer's numbers are in the order of the host that wrote it. Byte 2 of the buffer says
 * which: 2 is little-endian (x86, most ARM), 1 is big-endian (s390x). A host takes any value other than its
 * own for the other order. sec_convert_acl_to_host converts a buffer to host order; every other operation
 * takes host order only, and those that change or evaluate a buffer refuse any other (3417-115).
 *
 * Trust. A descriptor's length must be the actual number of bytes at data. Whatever those bytes are, no
 * operation reads or writes outside them, runs without end, or allocates more than they can fill. Pass bytes
 * from elsewhere through sec_convert_acl_to_host with a check first; operations do not repeat that check. On
 * bytes that it would have refused, they fail with 42 (3417-110) if something would extend past the end; a
 * search that reaches the end finds nothing; other results are unspecified. The check makes damaged bytes
 * safe to read, it does not make them true.
 *
 * Order. A buffer that this library writes has one sub-ACL per key (type, or type and mechanism), with user
 * and group entries in ascending order and each identity once. Other bytes may pass the check:
 *   - Of two sub-ACLs of one key, decisions, edits and listings of that key use the first. Listings of more
 *     than that key show both. Deleting the last entry of the first puts the second into force.
 *   - A decision walks user and group entries up to the first that does not sort before the identity, so it
 *     does not find one that is out of order after that. Listings show all entries in ascending order; an edit
 *     of their sub-ACL stores them so, and then all of them are in force.
 *   - Bytes after the last sub-ACL that the header counts are never in force.
 *
 * Threads. Every operation may run in any thread at any time. "Threads: shared" means that it only reads the
 * buffer, entry or set, which any number of threads may then use at once; "Threads: exclusive" means that no
 * other thread may use what the non-const arguments point to during the call. Errors are per thread. Handlers
 * and out-parameters are the caller's responsibility. Nothing here may be called from a signal handler.
 *
 * Forks. The child of a fork may call every operation, whatever other threads of its parent were doing: fork
 * waits until no thread holds a lock of this library or of those beneath it. A signal handler must therefore
 * not call fork: it would wait for the thread that it interrupts. The child has the handlers, and the recorded
 * error of the thread that forked. It must not use a buffer that another thread was changing. This does not
 * cover locks of the C library: looking up a username may need one, and so may a thread's first conversion if
 * the code set of the locale is not UTF-8.
 *
 * Cancellation. No operation is a cancellation point: one that opens a file, prints or holds a lock disables
 * cancellation and restores its state before it returns.
 */
#ifndef QZ_ACL_H
#define QZ_ACL_H

#include <stdint.h>

#if defined(__GNUC__)
#define QZ_ACL_API __attribute__((visibility("default")))
#else
#define QZ_ACL_API
#endif

#ifdef __cplusplus
extern "C" {
#endif

/* Return codes. */
#define SEC_S_OK 0              /* success; no error is recorded */
#define SEC_S_ADVISORY 1        /* not a failure; no operation below returns it */
#define SEC_S_BAD_PARAMETER 4   /* an argument cannot be used */
#define SEC_S_NO_MEMORY 6       /* an allocation failed, or the result would exceed the format's limits */
#define SEC_S_UNKNOWN_USER 15   /* there is no such user */
#define SEC_S_ACLE_NOT_FOUND 18 /* the entry to be deleted does not exist */
#define SEC_S_INTERNAL 23       /* the system failed unexpectedly */
#define SEC_S_CODESET 26        /* a text cannot be converted to or from UTF-8 */
#define SEC_S_BAD_PERMISSION 36 /* a permission without template, or a file that others can change */
#define SEC_S_FILE_ERROR 37     /* a file cannot be found, opened or read, or has a line that is too long */
#define SEC_S_BAD_ACL 42        /* a malformed line of an ACL file, or bytes that are not a usable ACL */
#define SEC_S_BAD_ACLE 43       /* an unsuitable or duplicate entry; when evaluating: nothing is granted */
#define SEC_S_WARNING 99        /* a warning of the command; no operation below returns it */
#define SEC_S_BAD_FILENAME 105  /* the path of an ACL file cannot be determined */

/* Types of an entry: to whom it applies, and whether it has a mechanism and an identity. */
#define SEC_ACLE_UNAUTHENTICATED 1 /* n: anyone who did not authenticate; neither; one per ACL */
#define SEC_ACLE_ANYOTHER 2        /* o: anyone else who did; neither; one per ACL */
#define SEC_ACLE_USER 4            /* u: one identity of a mechanism; both */
#define SEC_ACLE_EXPANDED 8        /* e: everyone the mechanism's handler accepts; both */
#define SEC_ACLE_GROUP 16          /* g: the members of a group; identity only, the group's name */

/* Flag for SEC_ACLE_USER in sec__single_acle_perm: compare with the mechanism's handler. */
#define SEC_ACLE_USE_ID_HANDLER 0x80

/* Kinds of identity handlers. */
#define SEC_ID_HANDLER_EXPANDED 1 /* for user-expanded entries; without a handler none match */
#define SEC_ID_HANDLER_USER 2     /* for user entries, instead of the comparison of bytes */

/* Flags of sec_read_acl_file: what the caller requests (in), and what the call reports (out). */
#define SEC_READ_ACL_TEXT 1    /* in: do not use the cache file; out: the ACL was read from its text */
#define SEC_READ_ACL_CACHE 2   /* in: write a missing or stale cache file; out: it was written */
#define SEC_READ_ACL_CONVERT 4 /* in: check and convert the cache file; out: cleared if the text was read */

/* One entry. Records that callers fill follow the same rules; the library never releases them. */
typedef struct sec_acle {
    uint32_t perm_mask; /* the permissions, one bit each */
    char mechanism[17]; /* types 4 and 8: name of 1 to 16 bytes and its NUL; others: empty */
    uint8_t type;       /* SEC_ACLE_... */
    char *identity;     /* types 4, 8 and 16: owned by records of this library; others: null */
} sec_acle_t;

/* The result of a listing. The record is the caller's; all zeros is the empty list. */
typedef struct sec_aclelist {
    int32_t count;      /* number of entries */
    sec_acle_t **acles; /* the array and its entries, owned by the list; null when there are none */
} sec_aclelist_t;

/* A permission: its bit, its letter in ACL files, and two texts for people; no operation reads them. */
typedef struct sec_perm_template {
    uint32_t bit;         /* one bit */
    char letter;          /* case matters */
    char name[14];        /* at most 13 bytes and a NUL */
    char description[65]; /* at most 64 bytes and a NUL */
} sec_perm_template_t;

/* The permissions of a service. Of templates that share a bit or a letter, the first is used. */
typedef struct sec_perm_set {
    int32_t count;                        /* number of templates; 0 refuses every permission */
    const sec_perm_template_t *templates; /* not owned; null only with a count of 0 */
} sec_perm_set_t;

/* A compiled ACL. All zeros is the empty ACL without bytes; an empty ACL may also be 5 bytes. */
typedef struct sec_acl_buffer {
    int32_t length; /* number of bytes at data */
    void *data;     /* from malloc, owned; at any alignment */
} sec_acl_buffer_t;

/* A group to which a requester belongs. */
typedef struct sec_group_ref {
    uint64_t id;      /* the caller's own; ignored */
    const char *name; /* as in group entries, UTF-8; must not be null */
} sec_group_ref_t;

/*
 * An identity handler: compares the requester's identity with an entry's, both UTF-8 and never null. 0: they
 * match. For SEC_ID_HANDLER_USER the sign of any other result is the order, as with strcmp, and must agree
 * with that of the stored entries (ascending, A to Z as a to z): a negative result ends the search. For
 * SEC_ID_HANDLER_EXPANDED every other result means no match.
 *
 * It runs with no lock held, may call this library, and must itself be thread-safe. An error that it records
 * is discarded if its result is not 0; with 0 it should leave none.
 *
 * It must not edit, convert or release the buffer that is being evaluated: the evaluation would continue in
 * memory that no longer belongs to the buffer. Make such changes after the evaluation returns.
 */
typedef int (*sec_id_compare_fn)(const char *requested, const char *entry);

/* A tree of entries. No operation returns one; the type exists for sec__dump_acltree. */
typedef struct sec_acltree sec_acltree_t;

/*
 * The default permissions, used where no set is given: r w c x C q l e d v s a o, for the bits 0x1 to 0x1000
 * in this order. Constant; any thread may read them.
 */
QZ_ACL_API extern const sec_perm_template_t acl__default_perm_list[13];
QZ_ACL_API extern const sec_perm_set_t acl__default_perm_set;

/* ---- Buffers ---- */

/*
 * Creates an ACL without entries: 5 bytes in host order. Does not clear the recorded error.
 *
 *   acl   out: the buffer, owned by the caller
 *
 * Codes: 0; 4 (3417-101) null acl; 6: acl->data is then null, acl->length unchanged.
 * Threads: exclusive.
 */
QZ_ACL_API int sec_create_empty_acl(sec_acl_buffer_t *acl);

/*
 * Copies bytes from elsewhere into a buffer, unchecked: convert and check it before use. First clears the
 * recorded error.
 *
 *   length   number of bytes, at least 1
 *   data     the bytes; they remain the caller's
 *   acl      out: the copy, owned by the caller; unchanged on failure
 *
 * Codes: 0; 4 (3417-101) length below 1 (position 1, shown as the value), null data or acl; 6.
 * Threads: shared for data, exclusive for acl.
 */
QZ_ACL_API int sec_read_acl_from_data(int length, const void *data, sec_acl_buffer_t *acl);

/*
 * Converts a buffer to host byte order, in place, or checks one that is already in host order. First clears
 * the recorded error.
 *
 *   check   non-zero: check the structure of a buffer in host order. A buffer that had to be converted is
 *           not checked by the same call; call again to check it.
 *   acl     the buffer; its bytes change only if they are in the other order
 *
 * Codes: 0: in host order and, with check, valid by the rules below
 *   4 (3417-101)    null acl, shown as position 2
 *   42 (3417-109)   no bytes, or the first two are not those of an ACL of version 1
 *   42 (3417-110)   a part extends past the end, or a sub-ACL does not start where the previous one ends
 *   and with check, for the first rule that is broken:
 *   42 (3417-119)   shorter than a header
 *   42 (3417-120)   a sub-ACL of unknown type
 *   42 (3417-121)   a mechanism where the type takes none
 *   42 (3417-122)   more than one entry of a type that takes one
 *   42 (3417-123)   a mechanism's length, including its NUL, below 2
 *   42 (3417-124)   a mechanism that does not end where its length says
 *   43 (3417-125)   an entry of a version other than 1
 *   43 (3417-126)   an identity where the type takes none
 *   43 (3417-127)   an identity that does not end where its length says
 * An entry fault (43) ends only its sub-ACL; if further sub-ACLs follow, the result is 42 (3417-110).
 * Permissions, order, repeated keys and the limit of 16 bytes for a mechanism are not checked.
 * After a failed conversion some numbers are converted and others are not: release the buffer.
 * Threads: exclusive.
 */
QZ_ACL_API int sec_convert_acl_to_host(int check, sec_acl_buffer_t *acl);

/*
 * Frees a buffer's bytes and zeroes its descriptor. First clears the recorded error.
 *
 *   acl   may be null, and may hold no bytes: both succeed and change nothing
 *
 * Codes: 0; 42 (3417-106) the first byte is not that of an ACL: nothing is freed or changed; free the bytes
 * with free(3).
 * Threads: exclusive.
 */
QZ_ACL_API int sec_release_acl(sec_acl_buffer_t *acl);

/* ---- Entries ---- */

/*
 * Creates an entry from texts in the locale's code set. First clears the recorded error.
 *
 * With the mechanism "unix" or "hba2" (in exactly this spelling), the text after the identity's first '@' is
 * a host. A user entry must have one; a user-expanded entry without '@' is a host as a whole. A host that is
 * a valid IPv6 address is stored in its canonical lower-case form, so that different spellings are one
 * identity; any other is stored as given.
 *
 *   type        SEC_ACLE_...
 *   perm_mask   stored unchecked
 *   mechanism   types 4 and 8: 1 to 16 bytes, before and after conversion. Others: ignored, may be null.
 *   identity    types 4, 8 and 16: not empty. Others: ignored, may be null.
 *   acle        out: the entry, for sec_release_acle; null after every failure
 *
 * Codes: 0; 6
 *   4 (3417-101)    type unknown (position 1), mechanism missing or too long (3), identity missing or
 *                   without its host (4), null acle (5)
 *   23 (3417-104)   the conversion failed unexpectedly
 *   26 (3417-142)   no conversion between the locale's code set and UTF-8
 *   26 (3417-143)   a text is not valid in the locale's code set
 * Threads: shared.
 */
QZ_ACL_API int sec_create_acle(uint8_t type, uint32_t perm_mask, const char *mechanism, const char *identity,
                               sec_acle_t **acle);

/*
 * Copies an entry's mechanism and identity in the locale's code set. First clears the recorded error.
 *
 *   acle        the entry
 *   mechanism   out: types 4 and 8: a text to be freed with free(3); others: null
 *   identity    out: types 4, 8 and 16: a text to be freed with free(3); others: null
 *
 * Codes: 0; 6; 23 (3417-104) and 26 (3417-142, 3417-143) as for sec_create_acle
 *   4 (3417-101)    an argument is null
 *   43 (3417-107)   the entry's type is unknown
 *   43 (3417-108)   the entry lacks a mechanism or identity that its type requires
 * Threads: shared.
 */
QZ_ACL_API int sec_display_acle_id(const sec_acle_t *acle, char **mechanism, char **identity);

/*
 * Frees an entry that sec_create_acle made, with its identity.
 *
 *   acle   may be null; never an entry of a list, nor a record of the caller's own
 *
 * Threads: exclusive.
 */
QZ_ACL_API void sec_release_acle(sec_acle_t *acle);

/*
 * Frees a list's entries and array, and zeroes the record.
 *
 *   list   may be null or empty
 *
 * Threads: exclusive.
 */
QZ_ACL_API void sec_release_aclelist(sec_aclelist_t *list);

/* ---- Permissions ---- */

/*
 * Converts permission letters, in any order and possibly repeated, to a mask. Does not clear the recorded
 * error.
 *
 *   text   the letters; empty or null: mask 0
 *   set    null: acl__default_perm_set
 *   mask   out: the bits; after 36, those of the letters before the unknown one
 *
 * Codes: 0; 4 (3417-101) null mask; 36 (3417-146) a letter without a template, shown in the message.
 * Threads: shared.
 */
QZ_ACL_API int sec_translate_perms(const char *text, const sec_perm_set_t *set, uint32_t *mask);

/*
 * Converts a mask to permission letters, from the lowest bit to the highest. Does not clear the recorded
 * error.
 *
 *   mask   the bits
 *   set    null: acl__default_perm_set
 *   out    room for 33 bytes: at most 32 letters and a NUL; unspecified after 36
 *
 * Codes: 0; 4 (3417-101) null out, shown with the name "sec_translate_mask"; 36 (3417-178) a bit without a
 * template, shown in the message.
 * Threads: shared.
 */
QZ_ACL_API int sec_translate_bitmask(uint32_t mask, const sec_perm_set_t *set, char *out);

/* ---- ACL files ---- */

/*
 * Reads an ACL file, from its cache file if that is current, else from its text. First clears the recorded
 * error.
 *
 * The cache file is the ACL file's path with ".cacl" appended. It is used if it is not empty, newer than the
 * ACL file in whole seconds, and has the same owner, group, permission bits and POSIX access control entries.
 * If there is any problem with it, the text is read without an error; a cache file that cannot be written does
 * not fail the call either. If the ACL file is replaced by rename before it is opened, the call starts over
 * with the new file.
 * Without SEC_READ_ACL_CONVERT the cache file's bytes are returned as they are, unchecked and in any order.
 *
 * A file that is replaced by one with an older time (mv, cp -p, rsync -t, a package) does not make its cache
 * stale: compile it again, touch it, or remove the cache. A cache written within the same second as the text
 * is never used.
 *
 * The cache file does not record the permission set. A service with a set of its own must pass
 * SEC_READ_ACL_TEXT and not SEC_READ_ACL_CACHE, and nobody may run "qzaclfck -s" on its file; otherwise a
 * cache made with other letters grants something else than the text.
 *
 *   aclfname    a path, absolute or relative to the working directory; with username a bare file name
 *   username    null, or the user in whose home directory the file is; this user must own it, and neither its
 *               group nor others may have write permission
 *   set         the permissions of the text; null: acl__default_perm_set
 *   flags       SEC_READ_ACL_...; other bits are returned unchanged
 *   acl         out: the buffer, owned by the caller; zeros after a failure and for a file without entries
 *               (empty, or only blank and comment lines), for which no cache file is written. Listing and
 *               editing take such an ACL; evaluation refuses it (42, 3417-109), so it grants nothing.
 *   out_flags   out, may be null: the resulting flags, written after failures too
 *
 * Codes: 0; 6
 *   4 (3417-101)    null aclfname (position 1) or acl (5)
 *   4 (3417-134)    username is empty
 *   4 (3417-165)    with username, aclfname holds a '/' or is too long for the home directory
 *   15 (3417-140)   there is no such user
 *   36 (3417-141)   with username, another user owns the file, or its group or others can write to it
 *   37 (3417-135)   no such file, not a regular one, or one that was replaced at every attempt (ESTALE)
 *   37 (3417-137)   the file cannot be opened
 *   37 (3417-139)   fewer bytes could be read than the file has
 *   105 (3417-166)  the working directory is unknown
 *   105 (3417-167)  the working directory and aclfname together exceed 4096 bytes
 *   105 (3417-168)  an absolute aclfname exceeds 4096 bytes
 *   and for the first bad line of the text:
 *   36 (3417-180)   a letter without a template
 *   37 (3417-158)   longer than 1096 bytes
 *   42 (3417-144)   a NUL byte before the end of the text
 *   42 (3417-145)   a mechanism longer than 16 bytes
 *   42 (3417-172)   too few words
 *   42 (3417-173)   too many words
 *   42 (3417-179)   an unknown type
 *   43 (3417-157)   a duplicate user or user-expanded entry
 *   43 (3417-174)   a second entry of type 1 or 2
 *   43 (3417-175)   a duplicate group entry
 * Threads: shared for set, exclusive for acl and out_flags.
 */
QZ_ACL_API int sec_read_acl_file(const char *aclfname, const char *username, const sec_perm_set_t *set,
                                 uint32_t flags, sec_acl_buffer_t *acl, uint32_t *out_flags);

/* ---- Listing ---- */

/*
 * Lists all entries, sub-ACL after sub-ACL: user and group entries sorted by identity, user-expanded ones in
 * the order in which they were added. If entries of one sub-ACL have equal identities, the first's spelling
 * and the last's permissions are listed. First clears the recorded error.
 *
 *   acl    the buffer; may hold no bytes (length 0 and null data)
 *   list   out: the entries, for sec_release_aclelist; unchanged after 4 and 42 (3417-109), empty after other
 *          failures
 *
 * Codes: 0; 6
 *   4 (3417-101)    an argument is null
 *   42 (3417-109)   not an ACL of version 1, or data without length
 *   42 (3417-110)   the header is truncated, a part extends past the end, a string does not end within its
 *                   field, or a type is unknown
 *   42 (3417-111)   a sub-ACL of type 1 or 2 with more than one entry
 *   42 (3417-123)   a mechanism longer than 16 bytes
 * Threads: shared for acl, exclusive for list.
 */
QZ_ACL_API int sec_list_acl(const sec_acl_buffer_t *acl, sec_aclelist_t *list);

/*
 * Lists the entries of one type, otherwise like sec_list_acl. An empty list is not a failure. First clears
 * the recorded error.
 *
 *   acl         the buffer; may hold no bytes
 *   type        SEC_ACLE_...
 *   mechanism   types 4 and 8: 1 to 16 bytes, or null for all mechanisms. Others: ignored.
 *   list        out: the entries, as for sec_list_acl
 *
 * Codes: those of sec_list_acl, and 4 (3417-101) also for an unknown type (position 2) or a mechanism that
 * is empty or too long (3).
 * Threads: shared for acl, exclusive for list.
 */
QZ_ACL_API int sec_list_acl_by_type(const sec_acl_buffer_t *acl, uint8_t type, const char *mechanism,
                                    sec_aclelist_t *list);

/* ---- Editing ---- */

/*
 * Adds an entry. If one with the same type, mechanism and identity exists, it gets the new permissions and
 * keeps its spelling. A new type or mechanism is placed after the others and before any bytes that the header
 * does not count. First clears the recorded error.
 *
 *   acle   the entry: types 4 and 8 with a mechanism, types 4, 8 and 16 with an identity; copied
 *   acl    the buffer; if data is null, it is created. After any failure the bytes are unchanged.
 *
 * Codes: 0
 *   4 (3417-101)    an argument is null
 *   6 (3417-102)    out of memory, or there would be more than 65535 sub-ACLs or 2^31 bytes or more
 *   23 (3417-104)   internal error: the result would hold no entry
 *   42 (3417-113)   the buffer is not an ACL
 *   42 (3417-114)   the buffer's version is not 1
 *   42 (3417-115)   the buffer is not in host byte order
 *   42 (3417-110, 3417-111, 3417-123)   as for sec_list_acl, of the header or the entry's sub-ACL; 3417-110
 *                   also if a new sub-ACL would follow one whose length disagrees with its entries
 *   43 (3417-116)   the entry's type is unknown
 *   43 (3417-117)   the entry lacks mechanism or identity, or its identity exceeds 65534 bytes
 * Threads: shared for acle, exclusive for acl.
 */
QZ_ACL_API int sec_add_acle_to_acl(const sec_acle_t *acle, sec_acl_buffer_t *acl);

/*
 * Adds an entry but refuses a duplicate; otherwise like sec_add_acle_to_acl, whose name its messages show.
 * First clears the recorded error.
 *
 *   acle, acl   as for sec_add_acle_to_acl
 *
 * Codes: those of sec_add_acle_to_acl, and
 *   43 (3417-157)   a duplicate user or user-expanded entry
 *   43 (3417-174)   a second entry of type 1 or 2
 *   43 (3417-175)   a duplicate group entry
 * Threads: shared for acle, exclusive for acl.
 */
QZ_ACL_API int sec_add_acle_to_acl2(const sec_acle_t *acle, sec_acl_buffer_t *acl);

/*
 * Deletes the entry of the same type, mechanism and identity; for types 1 and 2, the only one. Deleting its
 * last entry removes the sub-ACL. First clears the recorded error.
 *
 *   acle   the entry, as for sec_add_acle_to_acl; its permissions do not matter
 *   acl    the buffer. After any failure the bytes are unchanged, except that 6 may also mean that the entry
 *          was deleted but the memory could not be shrunk; the buffer is valid either way.
 *
 * Codes: 0; 6; 4 and 42 as for sec_add_acle_to_acl
 *   18 (3417-118)   there is no such entry
 *   42 (3417-106)   the buffer has no bytes
 *   43 (3417-116)   the entry's type is unknown
 *   43 (3417-117)   the entry lacks mechanism or identity
 *   43 (3417-118)   the entry's sub-ACL holds no entries
 * Threads: shared for acle, exclusive for acl.
 */
QZ_ACL_API int sec_del_acle_from_acl(const sec_acle_t *acle, sec_acl_buffer_t *acl);

/* ---- Access decisions ---- */

/*
 * Registers an identity handler for the life of the process. If there are several for the same kind and
 * mechanism (in any letter case), the first remains in force. First clears the recorded error. Its messages
 * show "acl__register_id_handler".
 *
 *   kind        SEC_ID_HANDLER_...
 *   mechanism   1 to 16 bytes, UTF-8; copied
 *   handler     must remain callable
 *
 * Codes: 0; 6
 *   4 (3417-101)    kind unknown (position 1), null mechanism (2) or handler (3)
 *   4 (3417-132)    mechanism empty or too long
 *   23 (3417-131)   the lock failed; if that was when releasing it, the handler is registered
 * Threads: any, even while others evaluate.
 */
QZ_ACL_API int sec__register_id_handler(uint32_t kind, const char *mechanism, sec_id_compare_fn handler);

/*
 * Evaluates what an ACL grants by entries of one type. Exactly one entry decides: the only one of type 1 or
 * 2, or the first of type 4 or 8 that matches. Allocates nothing. First clears the recorded error.
 *
 * User entries match without regard to letter case, or by the mechanism's SEC_ID_HANDLER_USER if the flag is
 * set and a handler is registered. User-expanded entries match only by SEC_ID_HANDLER_EXPANDED.
 *
 *   acl                the buffer, which must have bytes and be in host byte order
 *   type               SEC_ACLE_UNAUTHENTICATED, _ANYOTHER, _USER or _EXPANDED, optionally with
 *                      SEC_ACLE_USE_ID_HANDLER; bits 5 and 6 are ignored
 *   mechanism          types 4 and 8: the requester's, UTF-8; its handlers are used. Others: only shown in
 *                      messages, may be null.
 *   subacl_mechanism   types 4 and 8: the mechanism whose entries are searched; null: same as mechanism
 *   identity           types 4 and 8: the requester's, UTF-8, compared byte by byte except for the case of A
 *                      to Z: pass an IPv6 host in canonical form (cu_ipaddr_ntop_1). Others: ignored, may be
 *                      null.
 *   mask               out: the permissions. Unchanged after 4, after 42 (3417-109, 3417-115), and after 42
 *                      (3417-110) if the header itself is truncated; 0 after every other failure.
 *
 * Codes: 0
 *   4 (3417-101)    null acl (position 1) or mask (shown as 5)
 *   4 (3417-128)    any other type
 *   4 (3417-129)    types 4 and 8: mechanism null or empty
 *   4 (3417-130)    types 4 and 8: identity null or empty
 *   42 (3417-109)   no bytes, or not an ACL of version 1
 *   42 (3417-110)   the header is truncated, or an entry extends past the end
 *   42 (3417-115)   not in host byte order
 *   42 (3417-122)   more than one entry of type 1 or 2
 *   43 (3417-147)   nothing is granted: no entry matches. The ordinary denial, and as cheap as a grant.
 * Threads: shared.
 */
QZ_ACL_API int sec__single_acle_perm(const sec_acl_buffer_t *acl, uint8_t type, const char *mechanism,
                                     const char *subacl_mechanism, const char *identity, uint32_t *mask);

/*
 * Evaluates what an ACL grants to a requester's groups: the permissions of all that have an entry, together.
 * Allocates nothing. First clears the recorded error.
 *
 *   acl      as for sec__single_acle_perm
 *   count    number of groups; 0 is not a failure and grants nothing; negative: as groups without an entry
 *   groups   the groups, in any order; may be null when count is 0
 *   mask     out: the permissions; as for sec__single_acle_perm
 *
 * Codes: 0: at least one group has an entry, or count is 0
 *   4 (3417-101)    null acl (position 1), groups (3) or mask (4)
 *   42 (3417-109, 3417-110, 3417-115)   as for sec__single_acle_perm
 *   43 (3417-147)   nothing is granted: no group has an entry
 * Threads: shared.
 */
QZ_ACL_API int sec__group_acles_perm(const sec_acl_buffer_t *acl, int32_t count,
                                     const sec_group_ref_t *groups, uint32_t *mask);

/* ---- Dumps ---- */

/*
 * The dumps print for people, on standard error, in the locale's code set. An entry that cannot be shown is
 * replaced by the message that says why. If they printed anything, they leave no error recorded. Lines of
 * several threads may appear in any order.
 */

/*
 * Prints one line: "type = u; mech = unix; id = alice; permission = rw", omitting fields that the type lacks.
 *
 *   acle          may be null
 *   set           null: acl__default_perm_set
 *   indentation   printed before the line; must not be null
 *
 * Threads: shared.
 */
QZ_ACL_API void sec__dump_acle(const sec_acle_t *acle, const sec_perm_set_t *set, const char *indentation);

/*
 * Prints the entries of a tree in its order, with the letters of acl__default_perm_set.
 *
 *   node          the root; may be null
 *   indentation   printed before each line; must not be null
 *
 * Threads: shared.
 */
QZ_ACL_API void sec__dump_acltree(const sec_acltree_t *node, const char *indentation);

/*
 * Prints a sub-ACL's header, an empty line and its entries, with the letters of acl__default_perm_set; an
 * entry with a bit beyond them shows message 3417-178 instead. If a sub-ACL cannot be expanded, the reason is
 * printed on standard output instead of entries.
 *
 *   subacl        first byte of a sub-ACL of a buffer in host order that passed the check; may be null. It
 *                 takes no length argument and trusts the length in the sub-ACL's header.
 *   indentation   at most 6 bytes, printed before each line; entries get one tab more; must not be null
 *
 * Threads: shared.
 */
QZ_ACL_API void sec__dump_subacl(const void *subacl, const char *indentation);

/*
 * Prints a buffer's header and its sub-ACLs as sec__dump_subacl does, or one line saying that it is invalid.
 *
 *   acl   a buffer in host byte order; may be null, and may hold no bytes
 *
 * Threads: shared.
 */
QZ_ACL_API void sec__dump_acl(const sec_acl_buffer_t *acl);

#ifdef __cplusplus
}
#endif

#endif
