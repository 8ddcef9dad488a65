// The parts of the parser that whole texts do not reach, which text_fuzz holds against a second parser.
#include "qzacl_acl/entry_parser.h"
#include "support.h"

using namespace support;

TEST(parser, reads_permissions_by_the_templates_it_is_given) {
    const sec_perm_template_t templates[] = {{0x80000000, 'Z', "", ""}, {2, 'r', "", ""}, {4, 'r', "", ""}};
    const sec_perm_set_t own = {3, templates}, none = {0, nullptr};
    const guarded text(text_field("o rZ\no w\no r\no"));
    char *cursor = text.data();
    std::size_t left = text.size();
    std::uint32_t line = 1;
    sec_acle_t acle = {};
    const auto next = [&](const sec_perm_set_t &set) {
        return sec__read_acle_from_text(&set, &cursor, &left, &line, &acle);
    };
    EXPECT_EQ(next(own), 1);
    EXPECT_EQ(acle.perm_mask, 0x80000002);
    EXPECT_EQ(after(next(own)), error_of(36, 166, {"2", "w"}));
    EXPECT_EQ(after(next(none)), error_of(36, 166, {"3", "r"}));
    EXPECT_EQ(next(none), 1);
}
