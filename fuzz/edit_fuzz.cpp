// Compares adding and deleting with a plain model: many spellings of few keys, on buffers made by edits and on
// buffers that no edit would make. A step has four letters: the action (+ add, ! add if new, - delete), a type, a
// mechanism and an identity.
#include "fuzz.h"
#include "model.h"

namespace {

using namespace fuzz;
using namespace support;

// In several spellings each. The bytes between the cases and beyond ASCII do not fold.
const arguments mechanisms = words("unix UNIX uNix hba2 HBA2 a_[`{ A_[`{ sixteen-bytes-xx");
const arguments identities =
    words("a A b B ab aB Ab@x ab@X a_b a[b \xc3 \xe3 longer-name-1 LONGER-name-1 sixteen-bytes-16 "
          "sixteen-BYTES-16 seventeen-byte-17 seventeen-byte-1_ seventeen-byte-1Z");

int type(std::string_view &from) {
    const unsigned at = one_of("nouegUEG", from);
    return types[at < 5 ? at : at - 3];
}
const char *mechanism(std::string_view &from) { return mechanisms[one_of("01234567", from)].c_str(); }
const char *identity(std::string_view &from) {
    const unsigned at = one_of("abcdefghijklmnopqrs_", from);
    return at == identities.size() ? "" : identities[at].c_str();
}

// Sub-ACLs as no edit leaves them: unsorted, repeated, empty, odd, the same key twice.
model untidy(std::string_view &from) {
    model made;
    for (unsigned left = one_of("012345", from); left != 0; --left) {
        model_subacl subacl{type(from), mechanism(from)};
        subacl.odd = static_cast<oddity>(one_of("01234567", from) % 4);
        if (!has_mechanism(subacl.type))
            subacl.mechanism.clear();
        const unsigned limit = has_identity(subacl.type) ? 8 : 2;
        for (unsigned entries = one_of("01234567", from) % limit; entries != 0; --entries)
            subacl.stored.emplace_back(has_identity(subacl.type) ? identity(from) : "", left * 10 + entries);
        made.subacls.push_back(subacl);
    }
    return made;
}

// Bytes that nothing counts, and a last length that may take some of them or leave some of its own.
void hide(model &made, std::string_view &from) {
    made.behind = subacl_bytes("o: 4294967295").substr(one_of("0123456789abcdefgh", from));
    const std::size_t left = one_of("=abcdefghijklmnopqrstuvwxyz", from);
    if (made.subacls.empty() || left == 0)
        return;
    model_subacl &last = made.subacls.back();
    const std::size_t size = last.bytes().size();
    const std::size_t whole = size + made.behind.size();
    const std::size_t length = whole - std::min<std::size_t>(whole, left - 1);
    if (length != size)
        last.wrong_length = length;
}

void expect_edit(edit_function edit, const sec_acle_t &acle, buffer &held, model &wanted) {
    EXPECT_EQ(outcome_of(edit(&acle, &held.acl)), wanted.edit(edit, acle));
    EXPECT_EQ(held.bytes(), wanted.bytes());
}

// No odd sub-ACL is changed in place, so that the long way must come to the same.
void expect_edit_the_long_way(edit_function edit, const sec_acle_t &acle, model wanted) {
    for (model_subacl &each : wanted.subacls)
        if (each.odd == oddity::none)
            each.odd = oddity::unknown_version;
    buffer held(wanted.bytes());
    expect_edit(edit, acle, held, wanted);
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    std::string_view from = input(data, size);
    const unsigned kind = one_of("nuh", from);
    const bool is_untidy = kind != 0;
    model wanted = is_untidy ? untidy(from) : model();
    if (kind == 2)
        hide(wanted, from);
    buffer held(is_untidy ? wanted.bytes() : ""); // the first addition makes one
    for (std::uint32_t step = 1; !from.empty() && step < 200; ++step) {
        const bool is_empty = held.acl.data == nullptr;
        const edit_function edit = edits[one_of("+!-", from) % (is_empty ? 2 : 3)];
        const int of = type(from);
        const char *const by = mechanism(from);
        const char *const name = identity(from);
        // Fields that a type does not use must not matter.
        const bool lacks_mechanism = !has_identity(of) && step % 2 == 0;
        const bool lacks_identity = !has_identity(of) && step % 3 == 0;
        const sec_acle_t acle =
            entry(of, lacks_mechanism ? "" : by, lacks_identity ? nullptr : name, step * 0x1010101);
        if (!is_empty)
            expect_edit_the_long_way(edit, acle, wanted);
        expect_edit(edit, acle, held, wanted);
        EXPECT_TRUE(is_untidy || outcome_of(sec_convert_acl_to_host(with_check, &held.acl)) == no_error);
        EXPECT_EQ(list_of(held.acl), wanted.entries(0, nullptr));
        for (const int other : types)
            for (const char *with : {static_cast<const char *>(nullptr), by, "none"})
                EXPECT_EQ(list_of(held.acl, other, with), wanted.entries(other, with));
    }
    return 0;
}
