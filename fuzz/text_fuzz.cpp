// Whole ACL texts: what is accepted compiles to the model's bytes, which are sound, list what was
// written, come out of trees again, and can be written as a text that means the same.
#include "fuzz.h"
#include "model.h"
#include "qzacl_acl/compile.h"
#include "qzacl_acl/entry_parser.h"

namespace {

using namespace fuzz;

const std::vector<std::pair<int, int>> refusals = {{36, 166}, {37, 145}, {42, 131}, {42, 132},
                                                   {42, 158}, {42, 159}, {42, 165}};

// Compiles a text beside the model, which in the end is as the bytes are.
model compile(const std::string &text, buffer &out) {
    const guarded copy(text_field(text));
    char *cursor = copy.data();
    std::size_t left = copy.size();
    std::uint32_t line = 1, lines = 1;
    model plain;
    sec_acltree_array array;
    sec_acle_t acle;
    for (int result; (result = sec__read_acle_from_text(nullptr, &cursor, &left, &line, &acle)) != 0; ++lines) {
        if (result != 1) {
            const failure error = after(result);
            EXPECT_EQ(std::ranges::count(refusals, std::pair(error.code, error.id)), 1) << error;
        } else if (acle.type != 0) {
            const int added = sec__add_acle_to_trees(&acle, array);
            const failure wanted = plain.edit(sec_add_acle_to_acl2, acle);
            EXPECT_TRUE(added == wanted.code && recorded_error() == wanted) << wanted;
        }
    }
    EXPECT_EQ(line, lines);
    // The trees, in the order in which their keys appeared, are compiled the last first.
    std::ranges::reverse(plain.subacls);
    EXPECT_EQ(after(sec__acltrees_to_acl(array.trees(), &out.acl)), no_error);
    EXPECT_EQ(out.bytes(), plain.bytes());
    return plain;
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    buffer held, recompiled, rewritten;
    const model plain = compile(std::string(input(data, size)), held);
    EXPECT_EQ(after(sec_convert_acl_to_host(1, &held.acl)), no_error);
    EXPECT_EQ(list_of(held.acl), plain.entries(0, nullptr));
    std::vector<sec_acltree_t *> trees;
    std::vector<qz::owned_acltree> owners;
    std::string text;
    const auto *at = static_cast<const unsigned char *>(held.acl.data) + 5;
    for (const model_subacl &each : plain.subacls) {
        sec_acltree_t *root = nullptr;
        EXPECT_EQ(sec__subacl_to_acltree({at, each.bytes().size()}, &root), 0);
        at += each.bytes().size();
        owners.emplace_back(*trees.insert(trees.begin(), root));
        std::string lines;
        for (const auto &[name, mask] : each.stored) {
            char letters[33];
            EXPECT_EQ(sec_translate_bitmask(mask, nullptr, letters), 0);
            const char type = " no u   e       g"[each.type];
            lines += type + " "s + each.mechanism + " " + name + " " + letters + "\n";
        }
        text.insert(0, lines);
    }
    EXPECT_EQ(sec__acltrees_to_acl(trees, &recompiled.acl), 0);
    compile(text, rewritten);
    EXPECT_TRUE(recompiled.bytes() == held.bytes() && rewritten.bytes() == held.bytes());
    return 0;
}
