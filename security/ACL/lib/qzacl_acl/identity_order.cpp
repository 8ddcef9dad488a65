// The secret key for hashing identities.
#include "qzacl_acl/identity_order.h"

#include <sys/auxv.h>

namespace qz {

identity_hash_key make_identity_hash_key() {
    // The kernel gives every process sixteen random bytes. Reading them needs no system call and cannot fail.
    std::uint64_t first = 0;
    std::uint64_t second = 0;
    const auto *random = reinterpret_cast<const char *>(getauxval(AT_RANDOM));
    if (random != nullptr) {
        first = load8(random);
        second = load8(random + sizeof first);
    }
    return {hash_word(first, 0x9e3779b97f4a7c15, {0xd6e8feb86659fd93}) | 1,
            hash_word(second, 0xa0761d6478bd642f, {0xe7037ed1a0b428db}) | 1};
}

} // namespace qz
