// Passes arbitrary bytes as a buffer to every operation. None may read beyond them, run forever, return an
// unexpected code, or change them and fail. Buffers that the check accepts are compared with a second reader. An
// input is the letter b and the bytes, the last of which also serve as a request; or w and words, which become the
// users (mechanism m) and groups of a buffer in the given order.
#include "fuzz.h"
#include "model.h"
#include "qzacl_acl/validate.h"

namespace {

using namespace fuzz;
using namespace support;

int same_end(const char *wanted, const char *held) {
    return std::string_view(wanted).ends_with(held) ? 0 : 1;
}
int same_name(const char *wanted, const char *held) { return folded(wanted).compare(folded(held)); }
[[maybe_unused]] const int registered[] = {
    sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "ends", same_end),
    sec__register_id_handler(SEC_ID_HANDLER_USER, "names", same_name),
};

// Reads bytes that passed the check, and turns those of a copy into what a host of the other byte order writes.
struct reader {
    const std::string &bytes;
    std::string turned = bytes;
    std::size_t at = 3;

    model read() {
        model made;
        turned[2] = other_order;
        for (auto subacls = number(2); subacls != 0; --subacls)
            made.subacls.push_back(subacl());
        return made;
    }
    model_subacl subacl() {
        number(4);
        model_subacl made{static_cast<int>(number(1)), ""};
        auto entries = number(4);
        made.mechanism = text(number(1));
        for (; entries != 0; --entries) {
            number(1);
            const auto mask = static_cast<std::uint32_t>(number(4));
            made.stored.emplace_back(text(number(2)), mask);
        }
        return made;
    }
    std::size_t number(std::size_t width) {
        std::string field = bytes.substr(at, width);
        if (is_low_byte_first)
            std::ranges::reverse(field);
        std::size_t value = 0;
        for (const char byte : field)
            value = value << 8 | static_cast<unsigned char>(byte);
        std::reverse(&turned[at], &turned[at] + width);
        at += width;
        return value;
    }
    // Its NUL is counted.
    std::string text(std::size_t length) {
        at += length;
        return length == 0 ? "" : bytes.substr(at - length, length - 1);
    }
};

// The mask of the first entry that does not sort before the name, where it is the same, else 0.
std::uint32_t mask_by_walk(const items &all, const std::string &name) {
    const auto is_there = [&](const auto &held) { return folded(held.first) >= folded(name); };
    const auto last = std::ranges::find_if(all, is_there);
    return last != all.end() && same(last->first, name) ? last->second : 0;
}
// The mask of the first entry that the name ends with, or 0.
std::uint32_t mask_by_end(const items &all, const std::string &name) {
    const auto is_end = [&](const auto &held) { return name.ends_with(held.first); };
    const auto first = std::ranges::find_if(all, is_end);
    return first != all.end() ? first->second : 0;
}

// Whether an operation succeeded; the only other results are those that bytes or their lack of an entry may lead to.
bool succeeded(int result) {
    const std::array possible = {SEC_S_OK, SEC_S_ACLE_NOT_FOUND, SEC_S_BAD_ACL, SEC_S_BAD_ACLE};
    EXPECT_NE(std::ranges::find(possible, result), possible.end()) << result;
    EXPECT_EQ(outcome_of(result).code, result);
    return result == SEC_S_OK;
}

// The mask of a decision; 0 if it fails.
std::uint32_t decided(const sec_acl_buffer_t &acl, int type, const char *mechanism, const char *stored_as,
                      const std::string &name) {
    std::uint32_t mask = 0;
    const auto code = static_cast<std::uint8_t>(type);
    const bool is_decided =
        succeeded(sec__single_acle_perm(&acl, code, mechanism, stored_as, name.c_str(), &mask));
    EXPECT_TRUE(is_decided || mask == 0);
    return mask;
}
std::uint32_t decided(const sec_acl_buffer_t &acl, const std::vector<const char *> &names) {
    const auto groups = group_references(names);
    const auto count = static_cast<int>(groups.size());
    std::uint32_t mask = 0;
    const bool is_decided = succeeded(sec__group_acles_perm(&acl, count, groups.data(), &mask));
    EXPECT_TRUE(is_decided || mask == 0);
    return mask;
}

void expect_decisions(const sec_acl_buffer_t &acl, const model_subacl &held, const arguments &names) {
    const char *const stored_as = held.mechanism.c_str();
    std::uint32_t granted = 0;
    std::vector<const char *> groups = {nullptr};
    for (const std::string &name : names) {
        const std::uint32_t mask = mask_by_walk(held.stored, name);
        granted |= mask;
        groups.push_back(name.c_str());
        if (held.type == SEC_ACLE_USER) {
            EXPECT_EQ(decided(acl, SEC_ACLE_USER, "m", stored_as, name), mask);
            EXPECT_EQ(decided(acl, SEC_ACLE_USER | SEC_ACLE_USE_ID_HANDLER, "NAMES", stored_as, name), mask);
        } else if (held.type == SEC_ACLE_GROUP) {
            EXPECT_EQ(decided(acl, {name.c_str()}), mask);
        } else {
            EXPECT_EQ(decided(acl, held.type, "Ends", stored_as, name), mask_by_end(held.stored, name));
        }
    }
    EXPECT_EQ(held.type == SEC_ACLE_GROUP ? decided(acl, groups) : granted, granted);
}

// Edits either change nothing and fail or, if the model writes these bytes, change both alike.
void try_edits(const std::string &bytes, const model &held, const std::string &name) {
    const std::pair<int, const char *> keys[] = {{SEC_ACLE_USER, "UNIX"},        {SEC_ACLE_USER, "m"},
                                                 {SEC_ACLE_EXPANDED, "krb5"},    {SEC_ACLE_GROUP, ""},
                                                 {SEC_ACLE_UNAUTHENTICATED, ""}, {SEC_ACLE_ANYOTHER, ""}};
    for (const auto &[type, mechanism] : keys)
        for (const edit_function edit : edits) {
            const sec_acle_t acle = entry(type, mechanism, name.c_str(), 9);
            buffer made(bytes);
            const failure error = outcome_of(edit(&acle, &made.acl));
            EXPECT_TRUE(error == no_error || made.bytes() == bytes) << error;
            model wanted = held;
            if (bytes != held.bytes())
                continue;
            EXPECT_EQ(error, wanted.edit(edit, acle));
            EXPECT_EQ(made.bytes(), wanted.bytes());
        }
}

// Questions without a known answer: only their codes and bounds are checked.
void ask(const sec_acl_buffer_t &acl, const std::string &name) {
    sec_aclelist_t list = {};
    for (const int type : types) {
        for (const char *mechanism : {static_cast<const char *>(nullptr), "Unix", "m"}) {
            succeeded(sec_list_acl_by_type(&acl, static_cast<std::uint8_t>(type), mechanism, &list));
            sec_release_aclelist(&list);
        }
        if (type == SEC_ACLE_GROUP)
            continue;
        for (const char *mechanism : {"names", "ends"}) {
            decided(acl, type | SEC_ACLE_USE_ID_HANDLER, mechanism, "unix", name);
            decided(acl, type, mechanism, "krb5", name);
        }
    }
    decided(acl, {"staff", name.c_str(), "admins"});
}

// Dumps print; send them to /dev/null.
void dump_unseen(const sec_acl_buffer_t &acl) {
    static std::FILE *const nowhere = std::fopen("/dev/null", "w");
    std::FILE *const streams[] = {std::exchange(stdout, nowhere), std::exchange(stderr, nowhere)};
    sec__dump_acl(&acl);
    stdout = streams[0];
    stderr = streams[1];
    cu_set_no_error_1();
}

// Accepted bytes list, decide and convert as the second reader says.
void expect_sound(const sec_acl_buffer_t &acl, const std::string &bytes, const std::string &name) {
    reader second{bytes};
    const model held = second.read();
    try_edits(bytes, held, name);
    sec_aclelist_t list = {};
    const bool is_listed = succeeded(sec_list_acl(&acl, &list));
    const arguments entries = taken(list);
    const bool fits = std::ranges::all_of(held.subacls, [](auto &of) { return of.mechanism.size() <= 16; });
    EXPECT_EQ(is_listed, fits);
    EXPECT_TRUE(!fits || entries == held.entries(0, nullptr));
    arguments names = {name};
    for (const model_subacl &each : held.subacls)
        for (const auto &[identity, mask] : each.stored)
            names.push_back(identity.empty() ? "-" : identity);
    for (const model_subacl &each : held.subacls)
        if (&each == &*held.find(each.type, each.mechanism)) // only the first of a key is asked
            expect_decisions(acl, each, names);
    buffer swapped(second.turned);
    EXPECT_EQ(outcome_of(sec_convert_acl_to_host(with_check, &swapped.acl)), no_error);
    EXPECT_EQ(swapped.bytes(), bytes);
}

void use_everywhere(const std::string &bytes, const std::string &name) {
    buffer given(bytes);
    sec_acl_buffer_t &acl = given.acl;
    ask(acl, name);
    if (bytes.size() < 3 || bytes[2] == this_order)
        dump_unseen(acl);
    if (succeeded(sec__check_acl_buffer(&acl)) && bytes.starts_with(example.substr(0, 3))) {
        expect_sound(acl, bytes, name);
    } else {
        sec_aclelist_t list = {};
        succeeded(sec_list_acl(&acl, &list));
        sec_release_aclelist(&list);
        try_edits(bytes, model(), name);
    }
    EXPECT_EQ(given.bytes(), bytes);
    if (succeeded(sec_convert_acl_to_host(without_check, &acl)))
        succeeded(sec_convert_acl_to_host(with_check, &acl));
}

std::string users_and_groups(const arguments &names) {
    std::string entries;
    for (const std::string &each : names)
        entries += packed_entry(static_cast<std::uint32_t>(entries.size() * 77 + 1), text_field(each));
    return packed_acl(2, packed_subacl(SEC_ACLE_USER, text_field("m"), names.size(), entries) +
                             packed_subacl(SEC_ACLE_GROUP, "", names.size(), entries));
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    std::string_view from = input(data, size);
    const bool is_words = one_of("bw", from) == 1;
    std::string bytes(from);
    std::string name = bytes.substr(bytes.size() - std::min<std::size_t>(bytes.size(), 6)).c_str();
    if (is_words)
        bytes = users_and_groups(words(bytes.c_str()));
    if (bytes.empty())
        return 0;
    if (name.empty())
        name = "bob@host.example";
    use_everywhere(bytes, name);
    // The bytes of another host are used again in this one's order.
    buffer here(bytes);
    if (succeeded(sec_convert_acl_to_host(without_check, &here.acl)) && here.bytes() != bytes)
        use_everywhere(here.bytes(), name);
    return 0;
}
