// Tests of acl.hpp where its example does not reach: moves, ranges, what failures leave, decisions in no memory.
#include <algorithm>
#include <gtest/gtest.h>
#include <qz/acl.hpp>

static int allocations = 0;
#if !QZ_SANITIZED
extern "C" void *__libc_malloc(size_t);
extern "C" void *malloc(size_t size) noexcept {
    ++allocations;
    return __libc_malloc(size);
}
#endif

TEST(AclHpp, MovesAndDecidesWithoutMemory) {
    static qz::acl acl;
    static qz::acl other;
    static qz::acl &self = acl;
    ASSERT_EQ(acl.add(*qz::acl_entry::create(SEC_ACLE_GROUP, 5, nullptr, "staff")), SEC_S_OK);
    acl = std::move(self);
    other = std::move(acl);
    EXPECT_TRUE(std::ranges::equal(*other.list(), std::array{"staff"}, {}, &qz::entry_view::identity));
    const sec_group_ref_t groups[] = {{0, "none"}, {1, "STAFF"}};
    const int before = allocations;
    const qz::decision found = other.groups(groups);
    const qz::decision denied = other.single(qz::party::user("unix", "a@b"));
    EXPECT_EQ(allocations, before);
    EXPECT_TRUE(found.grants(4));
    EXPECT_FALSE(found.grants(6));
    EXPECT_TRUE(denied.no_entry());
    EXPECT_TRUE(
        acl.groups(groups).failed()); // NOLINT(bugprone-use-after-move): one that was moved from is empty
}

TEST(AclHpp, FailuresOutliveTheirOwner) {
    EXPECT_EQ(qz::acl::from_bytes("none", 4)->to_host(), SEC_S_BAD_ACL);
    // A sub-ACL of unknown type, in either byte order.
    for (const auto &bytes : {"\x85\1\1\0\1\0\0\0\x0a\x7f\0\0\0\0", "\x85\1\2\1\0\x0a\0\0\0\x7f\0\0\0\0"})
        EXPECT_EQ(qz::acl::from_bytes(bytes, 15)->to_host(), SEC_S_BAD_ACL);
    EXPECT_EQ(qz::error::current().text().substr(0, 8), "3417-120");
}
