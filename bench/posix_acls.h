// POSIX ACLs, if their library is installed: parsing a text, and looking up a user by number.
#ifndef QZ_BENCH_POSIX_ACLS_H
#define QZ_BENCH_POSIX_ACLS_H

#ifdef QZ_BENCH_LIBACL

#include <acl/libacl.h>
#include <benchmark/benchmark.h>
#include <cstdint>
#include <string>
#include <sys/acl.h>

namespace measured {

inline std::string posix_acl_text(std::uint32_t count) {
    std::string text = "user::rwx\ngroup::r-x\nother::---\nmask::rwx\n";
    for (std::uint32_t number = 0; number < count; ++number)
        text += "user:" + std::to_string(100000 + number) + ":r-x\n";
    return text;
}

inline void bench_posix_parse(benchmark::State &state, std::uint32_t count) {
    const std::string text = posix_acl_text(count);
    for (auto _ : state) {
        acl_t acl = acl_from_text(text.c_str());
        if (acl == nullptr) {
            state.SkipWithError("refused");
            break;
        }
        acl_free(acl);
    }
}

inline bool grants(acl_t acl, uid_t user) {
    acl_entry_t entry = nullptr;
    for (int id = ACL_FIRST_ENTRY; acl_get_entry(acl, id, &entry) == 1; id = ACL_NEXT_ENTRY) {
        acl_tag_t tag = 0;
        if (acl_get_tag_type(entry, &tag) != 0 || tag != ACL_USER)
            continue;
        void *held = acl_get_qualifier(entry);
        const bool is_match = held != nullptr && *static_cast<uid_t *>(held) == user;
        acl_free(held);
        if (is_match) {
            acl_permset_t permissions = nullptr;
            return acl_get_permset(entry, &permissions) == 0 && acl_get_perm(permissions, ACL_READ) == 1;
        }
    }
    return false;
}

inline void bench_posix_look_up(benchmark::State &state, std::uint32_t count) {
    acl_t acl = acl_from_text(posix_acl_text(count).c_str());
    for (auto _ : state) {
        if (!grants(acl, 100000 + count / 2))
            state.SkipWithError("not granted");
    }
    acl_free(acl);
}

} // namespace measured

#endif

#endif
