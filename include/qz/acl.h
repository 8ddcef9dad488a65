/*
 * Access control lists: reading, listing, editing and evaluating them.
 *
 * A service reads an ACL file into a buffer (sec_read_acl_file), registers identity handlers for its
 * mechanisms (sec__register_id_handler), asks what a party may do (sec__single_acle_perm,
 * sec__group_acles_perm), and lists or edits the buffer's entries. It releases the buffer with
 * sec_release_acl.
 *
 * ---- Rules that hold for every operation ----
 *
 * Results. An int result is a code SEC_S_...; SEC_S_OK (0) is success. A failing operation records an error
 * for the calling thread: the code and a numbered message, which <qz/cu.h> hands out (cu_get_error_1,
 * cu_get_errmsg_1). Below, "42 (3417-110)" stands for code 42 with the message of that number. No operation
 * prints, except the dumps.
 *
 * The recorded error on entry. Operations marked "Clears" first reset the thread's error, so that after
 * success none is recorded. The others leave an earlier error in place when they succeed.
 *
 * Null arguments. A pointer argument may be null only where its description says so. Null elsewhere gives
 * 4 (3417-101), which shows the operation's name, the argument's position (from 1) and the value 0.
 * Strings end with a NUL. The void operations accept null and then do nothing.
 *
 * Memory. Any operation that allocates can fail with 6 (3417-102), which shows a function's name and the
 * bytes asked for; the descriptions below name this code without repeating it. Results belong to the caller:
 *   - the bytes of a buffer: sec_release_acl
 *   - an entry that sec_create_acle made: sec_release_acle
 *   - the entries of a list: sec_release_aclelist
 *   - texts from sec_display_acle_id: free
 * Arguments are copied where they are kept; nothing that is handed out points into an argument.
 * An operation that allocates nothing takes memory in three cases all the same, and none of them can fail it:
 *   - the first operation of a process reads the configuration of tracing
 *   - a trace record of more than 4096 bytes is made
 *   - a failure with texts of more than 510 bytes together is recorded, such as the denial of a very long
 *     identity; without memory the texts are cut
 *
 * Out-parameters. What they held is overwritten, not released. After a failure they hold nothing (null, or
 * zeros) unless the description says otherwise.
 *
 * Code sets. Entries and buffers hold UTF-8. sec_create_acle and sec_display_acle_id convert between UTF-8
 * and the code set of the locale that was in force when the process first converted in that direction; call
 * setlocale before. Mechanisms and identities are compared without regard to the case of A to Z, other bytes
 * as they are.
 *
 * Byte order. A buffer's numbers are in the order of the host that wrote it, which byte 2 of the buffer
 * tells: 2 for the low byte first (x86, most ARM), 1 for the high byte first (s390x). A host takes any other
 * value than its own for the other order. sec_convert_acl_to_host brings a buffer into host order; every
 * other operation takes host order only, and those that change or evaluate a buffer refuse any other
 * (3417-115).
 *
 * Trust. A descriptor's length must be the true number of bytes behind data. Whatever those bytes are, no
 * operation reads or writes outside them, runs without end, or allocates more than they can fill. Bytes from
 * elsewhere go through sec_convert_acl_to_host with a check first; operations do not repeat that check. On
 * bytes that it would have refused, they fail with 42 (3417-110) where something would extend past the end,
 * the search for a sub-ACL that reaches the end finds none, and what they answer otherwise is unspecified.
 *
 * Order. What this library writes has one sub-ACL for each key, that is for each type or each type and
 * mechanism, with user and group entries in ascending order and each identity once. Other bytes may pass the
 * check:
 *   - Of two sub-ACLs of one key, decisions and edits use the first, and so does a listing by that key. The
 *     other shows where more is listed, and comes into force when the first goes with its last entry.
 *   - A decision walks user and group entries up to the first that does not sort before the wanted one, and
 *     so finds none that stands out of order behind that. Listings show all in ascending order; an edit of
 *     their sub-ACL stores them so, and then all of them are in force.
 *   - Bytes behind the last sub-ACL that the header counts are never in force.
 *
 * Threads. Every operation may run in any thread at any time. "Threads: shared" says that it only reads the
 * buffer, entry or set, which any number of threads may then use at once; "Threads: exclusive" that no other
 * thread may use what the non-const arguments point to during the call. Errors are per thread. Handlers and
 * out-parameters are the caller's business. Nothing here may be called from a signal handler.
 *
 * Forks. The child of a fork may call every operation, whatever other threads of its parent were doing: the
 * fork waits until none of them holds a lock of this library or of those beneath it. So a signal handler
 * must not call fork: it would wait for the thread that it interrupts. The child has the handlers, and the
 * recorded error of the thread that forked; a buffer that another thread was changing must not be used.
 * Locks of the C library are its own affair: it may need one to look up a username, and to convert for the
 * first time in a thread where the locale's code set is not UTF-8.
 *
 * Cancellation. No operation is a point where a thread can be cancelled: one that opens a file, prints or
 * holds a lock disables cancellation and puts its state back before it returns.
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
#define SEC_S_ADVISORY 1        /* texts that are no failure; no operation below returns it */
#define SEC_S_BAD_PARAMETER 4   /* an argument cannot be used */
#define SEC_S_NO_MEMORY 6       /* an allocation failed, or the result would exceed the format's limits */
#define SEC_S_UNKNOWN_USER 15   /* the system does not know the user */
#define SEC_S_ACLE_NOT_FOUND 18 /* the entry to be deleted is not there */
#define SEC_S_INTERNAL 23       /* the system failed in a way that it should not */
#define SEC_S_CODESET 26        /* a text cannot be converted to or from UTF-8 */
#define SEC_S_BAD_PERMISSION 36 /* a permission without template, or a file that others may change */
#define SEC_S_FILE_ERROR 37     /* a file cannot be found, opened or read, or holds a line that is too long */
#define SEC_S_BAD_ACL 42        /* a malformed line of an ACL file, or bytes that are no usable ACL buffer */
#define SEC_S_BAD_ACLE 43       /* an unsuitable or duplicate entry; when evaluating: nothing is granted */
#define SEC_S_WARNING 99        /* a warning of the command; no operation below returns it */
#define SEC_S_BAD_FILENAME 105  /* the name of an ACL file cannot be turned into a path */

/* Types of an entry: whom it means, and which of mechanism and identity it carries. */
#define SEC_ACLE_UNAUTHENTICATED 1 /* n: a party that did not authenticate; neither; one per ACL */
#define SEC_ACLE_ANYOTHER 2        /* o: any authenticated party; neither; one per ACL */
#define SEC_ACLE_USER 4            /* u: one identity of a mechanism; both */
#define SEC_ACLE_EXPANDED 8        /* e: what the mechanism's handler accepts; both */
#define SEC_ACLE_GROUP 16          /* g: a group; identity only, its name */

/* Flag beside SEC_ACLE_USER in sec__single_acle_perm: compare through the mechanism's handler. */
#define SEC_ACLE_USE_ID_HANDLER 0x80

/* Kinds of identity handlers. */
#define SEC_ID_HANDLER_EXPANDED 1 /* matches against user-expanded entries; without one none match */
#define SEC_ID_HANDLER_USER 2     /* matches against user entries, in place of the comparison of letters */

/* Flags of sec_read_acl_file: what the caller asks for, and what its out-flags then report. */
#define SEC_READ_ACL_TEXT 1    /* in: do not use the cache file; out: the ACL was read from its text */
#define SEC_READ_ACL_CACHE 2   /* in: write a missing or stale cache file; out: it was written */
#define SEC_READ_ACL_CONVERT 4 /* in: check and convert the cache file; out: cleared if the text was read */

/* One entry. Records that callers fill themselves follow the same rules and are never released here. */
typedef struct sec_acle {
    uint32_t perm_mask; /* the permissions, one bit each */
    char mechanism[17]; /* types 4 and 8: mnemonic of 1 to 16 bytes and its NUL; others: empty */
    uint8_t type;       /* SEC_ACLE_... */
    char *identity;     /* types 4, 8 and 16: owned by records of this library; others: null */
} sec_acle_t;

/* Entries handed out by a listing. The record is the caller's; all zeros is the empty list. */
typedef struct sec_aclelist {
    int32_t count;      /* number of entries */
    sec_acle_t **acles; /* the array and its entries, owned by the list; null when there are none */
} sec_aclelist_t;

/* A permission: its bit, its letter in ACL files, and two texts for people that nothing here reads. */
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
    int32_t length; /* bytes behind data */
    void *data;     /* from malloc, owned; at any alignment */
} sec_acl_buffer_t;

/* A group that a requester is in. */
typedef struct sec_group_ref {
    uint64_t id;      /* the caller's own; not looked at */
    const char *name; /* as in group entries, UTF-8; must not be null */
} sec_group_ref_t;

/*
 * An identity handler: compares the identity that an evaluation was asked for with an entry's, both UTF-8
 * and never null. 0: they match. For SEC_ID_HANDLER_USER the sign of any other result is the order, as with
 * strcmp, and must agree with that of the stored entries (ascending, letters folded): a negative result ends
 * the search. For SEC_ID_HANDLER_EXPANDED every other result is just no match.
 *
 * It runs with no lock held, may call this library, and must itself be safe to run in several threads. An
 * error that it records is dropped when its result is not 0; with 0 it should leave none.
 *
 * It must not edit, convert or release the buffer that is being evaluated: the evaluation would go on in
 * memory that is no longer the buffer's. Changes wait until the evaluation has returned.
 */
typedef int (*sec_id_compare_fn)(const char *requested, const char *entry);

/* A tree of entries. No operation hands one out; the type stands here for sec__dump_acltree. */
typedef struct sec_acltree sec_acltree_t;

/*
 * The permissions that hold where no set is given, and the set of them: r w c x C q l e d v s a o, for the
 * bits 0x1 to 0x1000 in this order. Constant; any thread may read them.
 */
QZ_ACL_API extern const sec_perm_template_t acl__default_perm_list[13];
QZ_ACL_API extern const sec_perm_set_t acl__default_perm_set;

/* ---- Buffers ---- */

/*
 * Makes an ACL without entries: 5 bytes in host order. Does not clear the recorded error.
 *
 *   acl   out: the buffer, owned by the caller
 *
 * Codes: 0; 4 (3417-101) null acl; 6: acl->data is null then, acl->length as it was.
 * Threads: exclusive.
 */
QZ_ACL_API int sec_create_empty_acl(sec_acl_buffer_t *acl);

/*
 * Copies bytes from elsewhere into a buffer, unexamined: convert and check it before use. Clears.
 *
 *   length   number of bytes, at least 1
 *   data     the bytes; remain the caller's
 *   acl      out: the copy, owned by the caller; untouched on failure
 *
 * Codes: 0; 4 (3417-101) length below 1 (position 1, shown as the value), null data or acl; 6.
 * Threads: shared for data, exclusive for acl.
 */
QZ_ACL_API int sec_read_acl_from_data(int length, const void *data, sec_acl_buffer_t *acl);

/*
 * Brings a buffer into host byte order, in place, or checks one that is in host order already. Clears.
 *
 *   check   non-zero: check the structure of a buffer in host order. A buffer that had to be converted is
 *           not checked by the same call; call again to check it.
 *   acl     the buffer; its bytes change only when they are in the other order
 *
 * Codes: 0: in host order, and with check sound as far as the rules below go
 *   4 (3417-101)    null acl, shown as position 2
 *   42 (3417-109)   no bytes, or the first two are not those of an ACL of version 1
 *   42 (3417-110)   a part extends past the end, or a sub-ACL starts elsewhere than the one before it says
 *   and with check, each for the first rule that is broken:
 *   42 (3417-119)   shorter than a header
 *   42 (3417-120)   a sub-ACL of unknown type
 *   42 (3417-121)   a mechanism where the type takes none
 *   42 (3417-122)   more than one entry of a type that takes one
 *   42 (3417-123)   a mechanism's length below 2, its NUL included
 *   42 (3417-124)   a mechanism that does not end where its length says
 *   43 (3417-125)   an entry of another version than 1
 *   43 (3417-126)   an identity where the type takes none
 *   43 (3417-127)   an identity that does not end where its length says
 * An entry fault (43) ends only its sub-ACL; when further sub-ACLs follow, the result is 42 (3417-110).
 * Neither permissions, order nor repeated keys are checked, nor that a mechanism has at most 16 bytes.
 * After a failed conversion some numbers are converted and others not: release the buffer.
 * Threads: exclusive.
 */
QZ_ACL_API int sec_convert_acl_to_host(int check, sec_acl_buffer_t *acl);

/*
 * Frees a buffer's bytes and zeroes its descriptor. Clears.
 *
 *   acl   may be null, and may hold no bytes: both succeed and change nothing
 *
 * Codes: 0; 42 (3417-106) the first byte is not that of an ACL: nothing is freed or changed, and the bytes
 * are to be freed with free.
 * Threads: exclusive.
 */
QZ_ACL_API int sec_release_acl(sec_acl_buffer_t *acl);

/* ---- Entries ---- */

/*
 * Makes an entry from texts in the locale's code set. Clears.
 *
 * With the mechanism "unix" or "hba2" (spelled just so), what follows the identity's first '@' is a host; a
 * user entry must have one, a user-expanded entry without '@' is all host. A host that reads as an IPv6
 * address is stored in its canonical lower-case form, so that different spellings are one identity; any
 * other is stored as given.
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
 *   23 (3417-104)   the conversion failed in a way that it should not
 *   26 (3417-142)   no conversion between the locale's code set and UTF-8
 *   26 (3417-143)   a text is not valid in the locale's code set
 * Threads: shared.
 */
QZ_ACL_API int sec_create_acle(uint8_t type, uint32_t perm_mask, const char *mechanism, const char *identity,
                               sec_acle_t **acle);

/*
 * Copies an entry's mechanism and identity in the locale's code set. Clears.
 *
 *   acle        the entry
 *   mechanism   out: types 4 and 8: a text for free; others: null
 *   identity    out: types 4, 8 and 16: a text for free; others: null
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
 * Turns permission letters, in any order and also repeated, into a mask. Does not clear the recorded error.
 *
 *   text   the letters; empty or null: mask 0
 *   set    null: acl__default_perm_set
 *   mask   out: the bits; after 36, those of the letters before the refused one
 *
 * Codes: 0; 4 (3417-101) null mask; 36 (3417-146) a letter without template, which the message shows.
 * Threads: shared.
 */
QZ_ACL_API int sec_translate_perms(const char *text, const sec_perm_set_t *set, uint32_t *mask);

/*
 * Turns a mask into permission letters, from the lowest bit to the highest. Does not clear the recorded
 * error.
 *
 *   mask   the bits
 *   set    null: acl__default_perm_set
 *   out    room for 33 bytes: at most 32 letters and a NUL; unspecified after 36
 *
 * Codes: 0; 4 (3417-101) null out, the name shown being "sec_translate_mask"; 36 (3417-178) a bit without
 * template, which the message shows.
 * Threads: shared.
 */
QZ_ACL_API int sec_translate_bitmask(uint32_t mask, const sec_perm_set_t *set, char *out);

/* ---- ACL files ---- */

/*
 * Reads an ACL file, from its cache file when that is current, else from its text. Clears.
 *
 * The cache file is the ACL file's path with ".cacl" appended. It is used when it is not empty, newer than
 * the ACL file in whole seconds, and has the same owner, group, permission bits and POSIX access control
 * entries. Any trouble with it leads to the text without an error; a cache file that cannot be written does
 * not fail the call either. When the ACL file is replaced by rename before it is opened, the call starts
 * over with the new file.
 * Without SEC_READ_ACL_CONVERT the cache file's bytes are handed out as they are, unchecked and in any order.
 *
 *   aclfname    a path, absolute or relative to the working directory; with username a bare file name
 *   username    null, or the user in whose home directory the file lies, who must own it and be the only
 *               one who may write it
 *   set         the permissions of the text; null: acl__default_perm_set
 *   flags       SEC_READ_ACL_...; other bits are handed back unchanged
 *   acl         out: the buffer, owned by the caller; zeros after a failure, and for a file without entries
 *               (empty, or blank and comment lines alone), of which no cache file is made. Such an ACL lists
 *               as empty and takes entries; evaluation refuses it (42, 3417-109), so that it grants nothing.
 *   out_flags   out, may be null: the flags as they came to hold, written after failures too
 *
 * Codes: 0; 6
 *   4 (3417-101)    null aclfname (position 1) or acl (5)
 *   4 (3417-134)    username is empty
 *   4 (3417-165)    with username, aclfname holds a '/' or is too long for the home directory
 *   15 (3417-140)   the system does not know username
 *   36 (3417-141)   with username, the file is another's or others may write it
 *   37 (3417-135)   no such file, not a regular one, or one that was replaced at every try (ESTALE)
 *   37 (3417-137)   the file cannot be opened
 *   37 (3417-139)   fewer bytes could be read than the file has
 *   105 (3417-166)  the working directory is unknown
 *   105 (3417-167)  the working directory and aclfname together exceed 4096 bytes
 *   105 (3417-168)  an absolute aclfname exceeds 4096 bytes
 *   and for the first bad line of the text:
 *   36 (3417-180)   a letter without template
 *   37 (3417-158)   longer than 1096 bytes
 *   42 (3417-144)   a NUL byte before the end of the text
 *   42 (3417-145)   a mechanism longer than 16 bytes
 *   42 (3417-172)   words are missing
 *   42 (3417-173)   words in excess
 *   42 (3417-179)   an unknown type
 *   43 (3417-157)   a user or user-expanded entry that is there already
 *   43 (3417-174)   a second entry of type 1 or 2
 *   43 (3417-175)   a group entry that is there already
 * Threads: shared for set, exclusive for acl and out_flags.
 */
QZ_ACL_API int sec_read_acl_file(const char *aclfname, const char *username, const sec_perm_set_t *set,
                                 uint32_t flags, sec_acl_buffer_t *acl, uint32_t *out_flags);

/* ---- Listing ---- */

/*
 * Lists all entries, sub-ACL after sub-ACL; user and group entries in the order of their identities,
 * user-expanded ones as they were added. Of entries with equal identities in one sub-ACL the first's
 * spelling and the last's permissions are listed. Clears.
 *
 *   acl    the buffer; may hold no bytes (length 0 and null data)
 *   list   out: the entries, for sec_release_aclelist; untouched by 4 and 42 (3417-109), else empty after a
 *          failure
 *
 * Codes: 0; 6
 *   4 (3417-101)    an argument is null
 *   42 (3417-109)   not an ACL of version 1, or data without length
 *   42 (3417-110)   the header is cut short, a part extends past the end, a string does not end in its field,
 *                   or a type is unknown
 *   42 (3417-111)   a sub-ACL of type 1 or 2 with more than one entry
 *   42 (3417-123)   a mechanism longer than 16 bytes
 * Threads: shared for acl, exclusive for list.
 */
QZ_ACL_API int sec_list_acl(const sec_acl_buffer_t *acl, sec_aclelist_t *list);

/*
 * Lists the entries of one type, otherwise as sec_list_acl. None is no failure. Clears.
 *
 *   acl         the buffer; may hold no bytes
 *   type        SEC_ACLE_...
 *   mechanism   types 4 and 8: 1 to 16 bytes, or null for those of every mechanism. Others: ignored.
 *   list        out: the entries, as for sec_list_acl
 *
 * Codes: those of sec_list_acl, and 4 (3417-101) also for an unknown type (position 2) and an empty or too
 * long mechanism (3).
 * Threads: shared for acl, exclusive for list.
 */
QZ_ACL_API int sec_list_acl_by_type(const sec_acl_buffer_t *acl, uint8_t type, const char *mechanism,
                                    sec_aclelist_t *list);

/* ---- Editing ---- */

/*
 * Adds an entry, or gives the one that is there (same type, mechanism and identity) the new permissions,
 * keeping its spelling. A new type or mechanism comes behind the others, and before any bytes that the header
 * does not count. Clears.
 *
 *   acle   the entry: types 4 and 8 with a mechanism, types 4, 8 and 16 with an identity; copied
 *   acl    the buffer; without bytes (data null) it is made. Bytes as before after every failure.
 *
 * Codes: 0
 *   4 (3417-101)    an argument is null
 *   6 (3417-102)    no memory, or it would be the 65536th sub-ACL, or 2^31 bytes or more
 *   23 (3417-104)   the result holds no entry, which should not happen
 *   42 (3417-113)   the buffer is not an ACL
 *   42 (3417-114)   the buffer's version is not 1
 *   42 (3417-115)   the buffer is not in host byte order
 *   42 (3417-110, 3417-111, 3417-123)   as for sec_list_acl, of the header or the entry's sub-ACL; 3417-110
 *                   also where a new sub-ACL would follow a last one whose length disagrees with its entries
 *   43 (3417-116)   the entry's type is unknown
 *   43 (3417-117)   the entry lacks mechanism or identity, or its identity exceeds 65534 bytes
 * Threads: shared for acle, exclusive for acl.
 */
QZ_ACL_API int sec_add_acle_to_acl(const sec_acle_t *acle, sec_acl_buffer_t *acl);

/*
 * Adds an entry and refuses one that is there already, otherwise as sec_add_acle_to_acl, whose name its
 * messages show. Clears.
 *
 *   acle, acl   as for sec_add_acle_to_acl
 *
 * Codes: those of sec_add_acle_to_acl, and
 *   43 (3417-157)   a user or user-expanded entry is there already
 *   43 (3417-174)   an entry of type 1 or 2 is there already
 *   43 (3417-175)   a group entry is there already
 * Threads: shared for acle, exclusive for acl.
 */
QZ_ACL_API int sec_add_acle_to_acl2(const sec_acle_t *acle, sec_acl_buffer_t *acl);

/*
 * Deletes the entry of the same type, mechanism and identity; for types 1 and 2 the only one there is. A
 * sub-ACL goes with its last entry. Clears.
 *
 *   acle   the entry, as for sec_add_acle_to_acl; its permissions do not matter
 *   acl    the buffer. Bytes as before after every failure, save that 6 may also mean that the entry is
 *          deleted but the memory could not be made smaller; the buffer is sound either way.
 *
 * Codes: 0; 6; 4 and 42 as for sec_add_acle_to_acl
 *   18 (3417-118)   there is no such entry
 *   42 (3417-106)   the buffer holds no bytes
 *   43 (3417-116)   the entry's type is unknown
 *   43 (3417-117)   the entry lacks mechanism or identity
 *   43 (3417-118)   the entry's sub-ACL holds no entries
 * Threads: shared for acle, exclusive for acl.
 */
QZ_ACL_API int sec_del_acle_from_acl(const sec_acle_t *acle, sec_acl_buffer_t *acl);

/* ---- Access decisions ---- */

/*
 * Registers an identity handler for the life of the process. Of several for the same kind and mechanism
 * (in any letter case) the first stays in force. Clears. Its messages show "acl__register_id_handler".
 *
 *   kind        SEC_ID_HANDLER_...
 *   mechanism   1 to 16 bytes, UTF-8; copied
 *   handler     must stay callable
 *
 * Codes: 0; 6
 *   4 (3417-101)    kind unknown (position 1), null mechanism (2) or handler (3)
 *   4 (3417-132)    mechanism empty or too long
 *   23 (3417-131)   the lock failed; registered all the same if that was at its release
 * Threads: any, also while others evaluate.
 */
QZ_ACL_API int sec__register_id_handler(uint32_t kind, const char *mechanism, sec_id_compare_fn handler);

/*
 * Tells what an ACL grants to one kind of party. Exactly one entry decides: the only one of type 1 or 2, or
 * the first of type 4 or 8 that matches. Allocates nothing. Clears.
 *
 * User entries match without regard to letter case, or through the mechanism's SEC_ID_HANDLER_USER when the
 * flag asks for it and one is registered. User-expanded entries match through SEC_ID_HANDLER_EXPANDED alone.
 *
 *   acl                the buffer, which must have bytes and be in host byte order
 *   type               SEC_ACLE_UNAUTHENTICATED, _ANYOTHER, _USER or _EXPANDED; SEC_ACLE_USE_ID_HANDLER
 *                      may be set beside it; bits 5 and 6 are ignored
 *   mechanism          types 4 and 8: the requester's, UTF-8; its handlers are used. Others: only shown in
 *                      messages, may be null.
 *   subacl_mechanism   types 4 and 8: the mechanism whose entries are searched; null: as mechanism
 *   identity           types 4 and 8: the requester's, UTF-8. Others: ignored, may be null.
 *   mask               out: the permissions. Untouched by 4, by 42 (3417-109, 3417-115), and by 42
 *                      (3417-110) when the header itself is cut short; 0 after every other failure.
 *
 * Codes: 0
 *   4 (3417-101)    null acl (position 1) or mask (shown as 5)
 *   4 (3417-128)    another type
 *   4 (3417-129)    types 4 and 8: mechanism null or empty
 *   4 (3417-130)    types 4 and 8: identity null or empty
 *   42 (3417-109)   no bytes, or not an ACL of version 1
 *   42 (3417-110)   the header is cut short, or an entry extends past the end
 *   42 (3417-115)   not in host byte order
 *   42 (3417-122)   more than one entry of type 1 or 2
 *   43 (3417-147)   nothing is granted: no entry matches. The everyday denial, and as cheap as a grant.
 * Threads: shared.
 */
QZ_ACL_API int sec__single_acle_perm(const sec_acl_buffer_t *acl, uint8_t type, const char *mechanism,
                                     const char *subacl_mechanism, const char *identity, uint32_t *mask);

/*
 * Tells what an ACL grants to a requester's groups: the permissions of all that have an entry, together.
 * Allocates nothing. Clears.
 *
 *   acl      as for sec__single_acle_perm
 *   count    number of groups; 0 is no failure and grants nothing; negative: as groups without an entry
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
 * The dumps print for people, on standard error, in the locale's code set. What cannot be shown is replaced
 * by the message that says why. They leave no error recorded when they printed anything. Lines of several
 * threads may come in any order.
 */

/*
 * Prints one line: "type = u; mech = unix; id = alice; permission = rw", without what the type lacks.
 *
 *   acle          may be null
 *   set           null: acl__default_perm_set
 *   indentation   stands before the line; must not be null
 *
 * Threads: shared.
 */
QZ_ACL_API void sec__dump_acle(const sec_acle_t *acle, const sec_perm_set_t *set, const char *indentation);

/*
 * Prints the entries of a tree in its order, with the letters of acl__default_perm_set.
 *
 *   node          the root; may be null
 *   indentation   stands before each line; must not be null
 *
 * Threads: shared.
 */
QZ_ACL_API void sec__dump_acltree(const sec_acltree_t *node, const char *indentation);

/*
 * Prints a sub-ACL's header, an empty line and its entries. A sub-ACL that cannot be expanded gives the
 * reason on standard output instead of entries.
 *
 *   subacl        first byte of a sub-ACL of a buffer in host order that passed the check; may be null. No
 *                 length comes with it, so here the length in its own header is trusted.
 *   indentation   at most 6 bytes, stands before each line; entries get one tab more; must not be null
 *
 * Threads: shared.
 */
QZ_ACL_API void sec__dump_subacl(const void *subacl, const char *indentation);

/*
 * Prints a buffer's header and its sub-ACLs, or one line that it is not valid.
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
