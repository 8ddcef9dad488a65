/*
 * A service that decides by an ACL: it reads the file through its cache, asks what a user may do, and edits the
 * ACL in memory.
 *
 * usage: service ACL-FILE USER@HOST [GROUP...]
 *
 * Run it in a UTF-8 locale: decisions take names in UTF-8, new entries take them in the locale's code set.
 */
#include <qz/acl.h>
#include <qz/cu.h>

#include <inttypes.h>
#include <locale.h>
#include <stdio.h>
#include <string.h>

static const char mechanism[] = "unix";

/* Prints why the last operation failed. */
static int failed(const char *what) {
    cu_error_t *error = NULL;
    char *text = NULL;

    if (cu_get_error_1(&error) == CU_OK && cu_get_errmsg_1(error, &text) == CU_OK)
        fprintf(stderr, "%s: %s", what, text);
    cu_rel_errmsg_1(text);
    cu_rel_error_1(error);
    return 1;
}

/*
 * A user-expanded entry of "unix" names a host or, with a dot in front, a domain. It accepts every user at that
 * host, or at any host in that domain. The dot matters: a bare suffix would also accept "evilcluster.example".
 */
static int compare_host(const char *requested, const char *entry) {
    const char *host = strchr(requested, '@');
    size_t length, suffix = strlen(entry);

    if (host == NULL)
        return 1;
    ++host;
    length = strlen(host);
    if (entry[0] == '.' && length > suffix)
        host += length - suffix;
    return cu_strcasecmp_posix_1(host, entry);
}

static int granted(const char *by, uint32_t mask) {
    char letters[33];

    if (sec_translate_bitmask(mask, NULL, letters) != SEC_S_OK)
        return failed("permissions");
    printf("granted by %s: %s\n", by, letters[0] != '\0' ? letters : "nothing");
    return 0;
}

/*
 * The most specific match decides: the user's own entry, else the user's domain, else the groups together, else
 * any other. SEC_S_BAD_ACLE means that no entry matches, which is an answer and not a failure.
 */
static int decide(const sec_acl_buffer_t *acl, const char *user, const sec_group_ref_t *groups,
                  int32_t count) {
    uint32_t mask = 0;
    int result;

    if (acl->length == 0) { /* a file without entries grants nothing, and evaluation refuses its buffer */
        puts("nothing is granted");
        return 0;
    }
    result = sec__single_acle_perm(acl, SEC_ACLE_USER, mechanism, NULL, user, &mask);
    if (result == SEC_S_OK)
        return granted("user", mask);
    if (result == SEC_S_BAD_ACLE) {
        result = sec__single_acle_perm(acl, SEC_ACLE_EXPANDED, mechanism, NULL, user, &mask);
        if (result == SEC_S_OK)
            return granted("domain", mask);
    }
    if (result == SEC_S_BAD_ACLE && count > 0) {
        result = sec__group_acles_perm(acl, count, groups, &mask);
        if (result == SEC_S_OK)
            return granted("groups", mask);
    }
    if (result == SEC_S_BAD_ACLE) {
        result = sec__single_acle_perm(acl, SEC_ACLE_ANYOTHER, mechanism, NULL, NULL, &mask);
        if (result == SEC_S_OK)
            return granted("any other", mask);
    }
    if (result == SEC_S_BAD_ACLE) {
        puts("nothing is granted");
        return 0;
    }
    return failed("decision");
}

/* Adds an entry for a user who has none, asks again, and deletes it. Only the ACL in memory changes. */
static int edit(sec_acl_buffer_t *acl, const char *user) {
    sec_acle_t *entry = NULL;
    uint32_t mask = 0;
    int status = 0;
    int result = sec_translate_perms("r", NULL, &mask);

    if (result == SEC_S_OK)
        result = sec_create_acle(SEC_ACLE_USER, mask, mechanism, user, &entry);
    if (result == SEC_S_OK)
        result = sec_add_acle_to_acl2(entry, acl);
    if (result == SEC_S_OK) {
        status = decide(acl, user, NULL, 0);
        result = sec_del_acle_from_acl(entry, acl);
        if (result == SEC_S_OK)
            puts("deleted again");
    } else if (result == SEC_S_BAD_ACLE) {
        puts("has an entry of its own, which stays");
        result = SEC_S_OK;
    }
    sec_release_acle(entry);
    return result == SEC_S_OK ? status : failed("edit");
}

int main(int argc, char **argv) {
    enum { max_groups = 64 };
    sec_group_ref_t groups[max_groups];
    int32_t count = 0;
    sec_acl_buffer_t acl;
    uint32_t flags = 0;
    const char *source;
    int status;

    setlocale(LC_ALL, ""); /* before the library first converts a name or fetches a message */
    if (argc < 3 || argc - 3 > max_groups) {
        fputs("usage: service ACL-FILE USER@HOST [GROUP...]\n", stderr);
        return 2;
    }
    for (; count < argc - 3; ++count) {
        groups[count].id = 0;
        groups[count].name = argv[count + 3];
    }
    if (sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, mechanism, compare_host) != SEC_S_OK)
        return failed("handler");
    if (sec_read_acl_file(argv[1], NULL, NULL, SEC_READ_ACL_CONVERT | SEC_READ_ACL_CACHE, &acl, &flags) !=
        SEC_S_OK)
        return failed(argv[1]);
    /* An empty file has no cache and sets no flag. */
    source = acl.length == 0 || (flags & SEC_READ_ACL_TEXT) != 0 ? "text" : "cache";
    printf("read from the %s, %" PRId32 " bytes%s\n", source, acl.length,
           (flags & SEC_READ_ACL_CACHE) != 0 ? ", cached" : "");

    status = decide(&acl, argv[2], groups, count);
    if (status == 0)
        status = edit(&acl, argv[2]);
    sec_release_acl(&acl);
    return status;
}
