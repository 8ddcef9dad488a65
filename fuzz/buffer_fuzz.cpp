// Arbitrary bytes as a buffer, through every operation: none may look behind them, run for ever, fail otherwise than it
// may, or fail and change them. What the check accepts is held against a second reading of it. An input is b and the
// bytes, whose last ones are also asked for; or w and words, which become the users (mechanism m) and groups of a
// buffer in the order in which they stand.
#include "fuzz.h"
#include "model.h"
#include "qzacl_acl/validate.h"

namespace {

using namespace fuzz;
using namespace support;

int same_end(const char *wanted, const char *held) { return std::string_view(wanted).ends_with(held) ? 0 : 1; }
int same_name(const char *wanted, const char *held) { return folded(wanted).compare(folded(held)); }
[[maybe_unused]] const int registered[] = {sec__register_id_handler(1, "ends", same_end),
                                           sec__register_id_handler(2, "names", same_name)};

// Reads bytes that passed the check, and turns those of a copy to what a host of the other byte order writes.
model read(const std::string &bytes, std::string &turned) {
    std::size_t at = 3;
    const auto number = [&](std::size_t width) {
        std::string field = bytes.substr(at, width);
        if (is_low_byte_first) std::ranges::reverse(field);
        std::size_t value = 0;
        for (const char byte : field) value = value << 8 | static_cast<unsigned char>(byte);
        std::reverse(&turned[at], &turned[at] + width);
        at += width;
        return value;
    };
    const auto text = [&](std::size_t length) { return bytes.substr((at += length) - length, length - (length != 0)); };
    model made;
    turned[2] = other_order;
    for (auto subacls = number(2); subacls != 0; --subacls) {
        number(4);
        model_subacl &subacl = made.subacls.emplace_back(model_subacl{static_cast<int>(number(1)), ""});
        auto entries = number(4);
        for (subacl.mechanism = text(number(1)); entries != 0; --entries) {
            number(1);
            const auto mask = static_cast<std::uint32_t>(number(4));
            subacl.stored.emplace_back(text(number(2)), mask);
        }
    }
    return made;
}

// The mask of the first entry that does not sort before the name, where it is the same, else 0.
std::uint32_t walked(const items &all, const std::string &name) {
    const auto last = std::ranges::find_if(all, [&](auto &held) { return folded(held.first) >= folded(name); });
    return last != all.end() && same(last->first, name) ? last->second : 0;
}

// Whether an operation succeeded; the only other results are those that bytes or their lack of an entry may lead to.
bool bears(int result) {
    EXPECT_TRUE(result == 0 || result == 18 || result == 42 || result == 43) << result;
    EXPECT_EQ(after(result).code, result);
    return result == 0;
}

// The mask of a decision, which is 0 when it fails.
std::uint32_t decided(const sec_acl_buffer_t &acl, int type, const char *by, const char *of, const std::string &name) {
    std::uint32_t mask = 0;
    EXPECT_TRUE(bears(sec__single_acle_perm(&acl, static_cast<std::uint8_t>(type), by, of, name.c_str(), &mask)) ||
                mask == 0);
    return mask;
}
std::uint32_t decided(const sec_acl_buffer_t &acl, const std::vector<const char *> &names) {
    std::vector<sec_group_ref_t> groups;
    for (const char *name : names) groups.push_back({0, name});
    std::uint32_t mask = 0;
    EXPECT_TRUE(bears(sec__group_acles_perm(&acl, static_cast<int>(groups.size()), groups.data(), &mask)) || mask == 0);
    return mask;
}

void expect_decisions(const sec_acl_buffer_t &acl, const model &held, const arguments &names) {
    for (const model_subacl &each : held.subacls) {
        if (&each != &*held.find(each.type, each.mechanism)) continue; // only the first of a key is asked
        const char *const of = each.mechanism.c_str();
        std::uint32_t granted = 0;
        std::vector<const char *> groups = {nullptr};
        for (const std::string &name : names) {
            const std::uint32_t mask = walked(each.stored, name);
            const auto ends = std::ranges::find_if(each.stored, [&](auto &with) { return name.ends_with(with.first); });
            if (each.type == 4)
                EXPECT_TRUE(decided(acl, 4, "m", of, name) == mask && decided(acl, 0x84, "NAMES", of, name) == mask);
            else if (each.type == 16)
                EXPECT_EQ(decided(acl, {name.c_str()}), mask);
            else
                EXPECT_EQ(decided(acl, each.type, "Ends", of, name), ends == each.stored.end() ? 0 : ends->second);
            granted |= mask;
            groups.push_back(name.c_str());
        }
        EXPECT_EQ(each.type == 16 ? decided(acl, groups) : granted, granted);
    }
}

// What edits make of the bytes: where these are what the model writes, what they make of the model.
void try_edits(const std::string &bytes, const model &held, const std::string &name) {
    const std::pair<int, const char *> keys[] = {{4, "UNIX"}, {4, "m"}, {8, "krb5"}, {16, ""}, {1, ""}, {2, ""}};
    for (const auto &[type, by] : keys)
        for (const auto edit : {sec_add_acle_to_acl, sec_add_acle_to_acl2, sec_del_acle_from_acl}) {
            const sec_acle_t acle = entry(type, by, name.c_str(), 9);
            buffer made(bytes);
            const failure error = after(edit(&acle, &made.acl));
            EXPECT_TRUE(error == no_error || made.bytes() == bytes) << error;
            model wanted = held;
            if (bytes != held.bytes()) continue;
            EXPECT_EQ(error, wanted.edit(edit, acle));
            EXPECT_EQ(made.bytes(), wanted.bytes());
        }
}

void use_everywhere(const std::string &bytes, const std::string &name) {
    buffer given(bytes);
    sec_acl_buffer_t &acl = given.acl;
    buffer copy;
    EXPECT_EQ(after(sec_read_acl_from_data(acl.length, acl.data, &copy.acl)), no_error);
    EXPECT_EQ(copy.bytes(), bytes);
    const bool is_sound = bears(sec__check_acl_buffer(&acl)) && bytes.starts_with(example.substr(0, 3));
    sec_aclelist_t list = {};
    const bool is_listed = bears(sec_list_acl(&acl, &list));
    const arguments all = taken(list);
    for (const int type : {4, 8, 16, 1, 2}) {
        for (const char *by : {static_cast<const char *>(nullptr), "Unix", "m"}) {
            bears(sec_list_acl_by_type(&acl, type & 31, by, &list));
            sec_release_aclelist(&list);
        }
        for (const char *by : {"names", "ends"})
            if (type != 16) decided(acl, type | 0x80, by, "unix", name), decided(acl, type, by, "krb5", name);
    }
    decided(acl, {"staff", name.c_str(), "admins"});
    // For people, who are not there.
    static std::FILE *const nowhere = std::fopen("/dev/null", "w");
    std::FILE *const streams[] = {std::exchange(stdout, nowhere), std::exchange(stderr, nowhere)};
    if (bytes.size() < 3 || bytes[2] == this_order) sec__dump_acl(&acl);
    std::tie(stdout, stderr) = std::tie(streams[0], streams[1]);
    cu_set_no_error_1();

    std::string turned = bytes;
    const model held = is_sound ? read(bytes, turned) : model();
    try_edits(bytes, held, name);
    EXPECT_EQ(given.bytes(), bytes);
    if (is_sound) {
        const bool fits = std::ranges::all_of(held.subacls, [](auto &of) { return of.mechanism.size() <= 16; });
        EXPECT_EQ(is_listed, fits);
        EXPECT_EQ(all, fits ? held.entries(0, nullptr) : all);
        arguments names = {name};
        for (const model_subacl &each : held.subacls)
            for (const auto &stored : each.stored) names.push_back(stored.first.empty() ? "-" : stored.first);
        expect_decisions(acl, held, names);
        buffer swapped(turned);
        EXPECT_EQ(after(sec_convert_acl_to_host(1, &swapped.acl)), no_error);
        EXPECT_EQ(swapped.bytes(), bytes);
    }
    bears(sec_convert_acl_to_host(0, &acl)) && bears(sec_convert_acl_to_host(1, &acl));
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    std::string_view from = input(data, size);
    const bool is_words = one_of("bw", from) == 1;
    std::string bytes(from), name = bytes.substr(bytes.size() - std::min<std::size_t>(bytes.size(), 6)).c_str();
    if (is_words) {
        const arguments names = words(bytes.c_str());
        std::string all;
        for (const std::string &each : names) all += named(static_cast<std::uint32_t>(all.size() * 77 + 1), each);
        bytes = packed_acl(2, of_mechanism(4, "m", names.size(), all) + packed_subacl(16, "", names.size(), all));
    }
    if (bytes.empty()) return 0;
    if (name.empty()) name = "bob@host.example";
    use_everywhere(bytes, name);
    // What another host wrote is used again in this one's order.
    if (buffer here(bytes); bears(sec_convert_acl_to_host(0, &here.acl)) && here.bytes() != bytes)
        use_everywhere(here.bytes(), name);
    return 0;
}
