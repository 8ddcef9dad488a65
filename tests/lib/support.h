// What the tests of the ACL library share: errors, files and folders, processes, ACLs written as text, and their bytes.
#ifndef QZ_TESTS_SUPPORT_H
#define QZ_TESTS_SUPPORT_H

#include "msg/messages.h"
#include "qz/acl.h"
#include "qz/cu.h"

#include <algorithm>
#include <bit>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <gtest/gtest.h>
#include <iterator>
#include <pthread.h>
#include <random>
#include <sstream>
#include <string>
#include <sys/wait.h>
#include <sys/xattr.h>
#include <unistd.h>
#include <vector>

namespace support {

using namespace std::literals;
namespace msg = qz::msg;
using arguments = std::vector<std::string>;

// Arguments that are numbers.
enum check_choice : int { without_check, with_check };
inline constexpr int by_handler = SEC_ACLE_USER | SEC_ACLE_USE_ID_HANDLER;

// ---- Texts ----

inline arguments split(const std::string &text, char separator) {
    arguments parts;
    std::istringstream stream(text);
    for (std::string part; std::getline(stream, part, separator);)
        parts.push_back(part);
    return parts;
}

inline arguments words(const std::string &text) {
    std::istringstream stream(text);
    return {std::istream_iterator<std::string>(stream), {}};
}

// Letters fold, all other bytes count as they are. std::string compares bytes as unsigned.
inline std::string folded(std::string text) {
    for (char &c : text)
        c = c >= 'A' && c <= 'Z' ? static_cast<char>(c + 32) : c;
    return text;
}
inline bool same(const std::string &a, const std::string &b) { return folded(a) == folded(b); }

// ---- Errors ----

struct failure {
    int code = 0;
    int id = 0;
    std::string text = {};

    bool operator==(const failure &) const = default;
    friend std::ostream &operator<<(std::ostream &out, const failure &error) {
        return out << "code " << error.code << ", message " << error.id << ": " << error.text;
    }
};
inline const failure no_error;

// The error of this thread. Clears it.
inline failure recorded_error() {
    cu_error_t *error = nullptr;
    char *text = nullptr;
    EXPECT_EQ(cu_get_error_1(&error), CU_OK);
    EXPECT_EQ(cu_get_errmsg_1(error, &text), CU_OK);
    failure found{error->code, error->message_id, text};
    cu_rel_errmsg_1(text);
    cu_rel_error_1(error);
    cu_set_no_error_1();
    return found;
}

// The place at the end of a located message, and what replaces its line number.
inline const std::string source = "security/ACL/lib/qzacl_acl";
inline const std::string some_line = "LINE";

// The error that an operation recorded. Its code must be the result.
inline failure outcome_of(int result) {
    failure found = recorded_error();
    EXPECT_EQ(result, found.code);
    if (const std::size_t at = found.text.rfind(source + ":"); at != std::string::npos) {
        const std::size_t line = at + source.size() + 1;
        found.text.replace(line, found.text.size() - line - 2, some_line);
    }
    return found;
}

inline std::string shown(const std::string &text) { return text; }
inline std::string shown(int number) { return std::to_string(number); }

// The error with a message and its arguments; of a located message the last two are left out.
template <int Id, class... Args>
failure error_of(int code, const msg::message<Id, Args...> & /*message*/, const auto &...given) {
    arguments args = {shown(given)...};
    if (sizeof...(given) + 2 == sizeof...(Args))
        args.insert(args.end(), {source, some_line});
    failure made{code, Id, std::string(msg::default_text(Id))};
    for (std::size_t at = 0; (at = made.text.find('$', at)) != std::string::npos;) {
        const std::string &arg = args.at(static_cast<std::size_t>(made.text[at - 1] - '1'));
        at -= 2;
        made.text.replace(at, made.text.find_first_of("sdxc", at) + 1 - at, arg);
        at += arg.size();
    }
    return made;
}
inline failure bad_acl(const auto &message, const auto &...given) {
    return error_of(SEC_S_BAD_ACL, message, given...);
}
inline failure bad_acle(const auto &message, const auto &...given) {
    return error_of(SEC_S_BAD_ACLE, message, given...);
}
inline failure bad_parameter(const std::string &function, int position, const std::string &value = "0") {
    return error_of(SEC_S_BAD_PARAMETER, msg::incorrect_parameter, function, position, value);
}

// A pointer as that message shows it.
inline std::string address(const void *pointer) {
    std::ostringstream text;
    text << std::hex << static_cast<std::uint32_t>(reinterpret_cast<std::uintptr_t>(pointer));
    return text.str();
}

// ---- Files ----

struct temporary_folder {
    temporary_folder() : path(mkdtemp((testing::TempDir() + "qzacl-test-XXXXXX").data())) {}
    temporary_folder(const temporary_folder &) = delete;
    ~temporary_folder() { std::filesystem::remove_all(path); }
    std::string operator/(const std::string &name) const { return path + "/" + name; }
    const std::string path;
};

// `age` in seconds.
inline void write_file(const std::string &path, const std::string &bytes, int age = 0, unsigned mode = 0644) {
    using namespace std::filesystem;
    std::ofstream(path, std::ios::binary) << bytes;
    last_write_time(path, file_time_type::clock::now() - std::chrono::seconds(age));
    permissions(path, perms(mode));
}
inline std::string read_file(const std::string &path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

// Gives a file the entries of a POSIX ACL: one for user 1, a group that may read, and a mask, which the group
// bits of the mode then show. False where the file system has none.
inline bool give_entries(const std::string &path, unsigned user_bits, unsigned mask) {
    const std::string no_id(4, '\xff');
    const std::string user_1 = "\2\0"s + static_cast<char>(user_bits) + "\0\1\0\0\0"s;
    const std::string owner = "\1\0\6\0"s + no_id;
    const std::string group = "\4\0\4\0"s + no_id;
    const std::string others = "\x20\0\4\0"s + no_id;
    const std::string limit = "\x10\0"s + static_cast<char>(mask) + "\0"s + no_id;
    const std::string all = "\2\0\0\0"s + owner + user_1 + group + limit + others;
    return setxattr(path.c_str(), "system.posix_acl_access", all.data(), all.size(), 0) == 0;
}

// ---- Processes and threads ----

// The status of a process that does this.
inline int status_of_child(const std::function<void()> &body) {
    const pid_t child = fork();
    if (child == 0) {
        body();
        _exit(0);
    }
    int status = -1;
    EXPECT_EQ(waitpid(child, &status, 0), child);
    return status;
}

// Runs this in a thread with a pending cancellation, which takes effect at the first cancellation point.
inline void run_cancelled(std::function<void()> body) {
    const auto start = [](void *given) -> void * {
        pthread_cancel(pthread_self());
        (*static_cast<std::function<void()> *>(given))();
        pthread_testcancel();
        return nullptr;
    };
    pthread_t thread = {};
    void *ended = nullptr;
    ASSERT_EQ(pthread_create(&thread, nullptr, start, &body), 0);
    pthread_join(thread, &ended);
    EXPECT_EQ(ended, PTHREAD_CANCELED);
}

// ---- Entries ----

// They borrow their texts.
inline sec_acle_t entry(int type, std::string_view mechanism, const char *identity, std::uint32_t mask) {
    sec_acle_t made = {mask, "", static_cast<std::uint8_t>(type), const_cast<char *>(identity)};
    mechanism.copy(made.mechanism, sizeof made.mechanism - 1);
    return made;
}
inline sec_acle_t user(std::string_view mechanism, const char *identity, std::uint32_t mask) {
    return entry(SEC_ACLE_USER, mechanism, identity, mask);
}
inline sec_acle_t expanded(std::string_view mechanism, const char *identity, std::uint32_t mask) {
    return entry(SEC_ACLE_EXPANDED, mechanism, identity, mask);
}
inline sec_acle_t group(const char *identity, std::uint32_t mask) {
    return entry(SEC_ACLE_GROUP, "", identity, mask);
}

// The groups of a requester. They borrow their names, which may be null.
inline std::vector<sec_group_ref_t> group_references(const std::vector<const char *> &names) {
    std::vector<sec_group_ref_t> made;
    for (const char *name : names)
        made.push_back({0, name});
    return made;
}

// The letter of its type, its mechanism and identity where it has them, and its mask.
inline std::string text_of(const sec_acle_t &acle) {
    const std::string mechanism = acle.mechanism[0] == '\0' ? "" : " "s + acle.mechanism;
    const std::string identity = acle.identity == nullptr ? "" : " "s + acle.identity;
    return "?no?u???e???????g"[acle.type] + mechanism + identity + " " + std::to_string(acle.perm_mask);
}

// The entries of a list. Releases it.
inline arguments taken(sec_aclelist_t &list) {
    arguments entries;
    for (std::int32_t at = 0; at < list.count; ++at)
        entries.push_back(text_of(*list.acles[at]));
    sec_release_aclelist(&list);
    return entries;
}

// ---- Bytes ----

// A buffer as the library holds one: its bytes in a block of malloc of exactly their number.
struct buffer {
    explicit buffer(const std::string &bytes = "") {
        if (const std::size_t size = bytes.size(); size != 0)
            acl = {static_cast<std::int32_t>(size), std::memcpy(std::malloc(size), bytes.data(), size)};
    }
    buffer(buffer &&) = delete;
    ~buffer() { std::free(acl.data); }
    std::string bytes() const {
        return {static_cast<char *>(acl.data), static_cast<std::size_t>(acl.length)};
    }
    sec_acl_buffer_t acl = {};
};

// Its parts. Numbers are in host order; strings are given with their NUL.
inline constexpr bool is_low_byte_first = std::endian::native == std::endian::little;
inline constexpr char this_order = is_low_byte_first ? 2 : 1;
inline constexpr char other_order = is_low_byte_first ? 1 : 2;

inline std::string number(std::uint64_t value, std::size_t width) {
    std::string bytes;
    for (; bytes.size() < width; value >>= 8)
        bytes.insert(is_low_byte_first ? bytes.end() : bytes.begin(), static_cast<char>(value & 0xff));
    return bytes;
}
inline std::string text_field(std::string_view text) { return std::string(text) + '\0'; }
inline std::string packed_entry(std::uint32_t mask, std::string_view identity) {
    return "\1"s + number(mask, 4) + number(identity.size(), 2) + std::string(identity);
}
inline std::string packed_subacl(int type, const std::string &mechanism, std::uint64_t count,
                                 const std::string &entries) {
    return number(10 + mechanism.size() + entries.size(), 4) + static_cast<char>(type) + number(count, 4) +
           static_cast<char>(mechanism.size()) + mechanism + entries;
}
inline std::string packed_acl(std::uint64_t count, const std::string &subacls) {
    return "\x85\1"s + this_order + number(count, 2) + subacls;
}
inline std::string acl_of_one(const std::string &subacl) { return packed_acl(1, subacl); }

// The same from text: an entry is "NAME MASK" or "MASK", a sub-ACL its letter, its mechanism where it has one and
// its entries, as in "u unix: al 1, bob 2", and an ACL is its sub-ACLs with semicolons between them.
inline std::string entry_bytes(const std::string &text) {
    const arguments parts = words(text);
    const auto mask = static_cast<std::uint32_t>(std::stoul(parts.back()));
    return packed_entry(mask, parts.size() == 1 ? "" : text_field(parts[0]));
}
inline std::string subacl_bytes(const std::string &text) {
    const std::size_t colon = text.find(':');
    const arguments key = words(text.substr(0, colon));
    const int type = 1 << "noueg"s.find(key[0]);
    const arguments held = split(text.substr(colon + 1), ',');
    std::string entries;
    for (const std::string &each : held)
        entries += entry_bytes(each);
    return packed_subacl(type, key.size() == 1 ? "" : text_field(key[1]), held.size(), entries);
}
inline std::string acl_bytes(const std::string &text) {
    const arguments held = split(text, ';');
    std::string subacls;
    for (const std::string &each : held)
        subacls += subacl_bytes(each);
    return packed_acl(held.size(), subacls);
}

// The 31 bytes that the format is explained with, as hosts of either order write them.
inline const std::string low_byte_first = "\x85\1\2\1\0\x1a\0\0\0\4\1\0\0\0\5abcd\0\1\3\0\0\0\4\0xyz\0"s;
inline const std::string high_byte_first = "\x85\1\1\0\1\0\0\0\x1a\4\0\0\0\1\5abcd\0\1\0\0\0\3\0\4xyz\0"s;
inline const std::string example = is_low_byte_first ? low_byte_first : high_byte_first;
inline const std::string foreign = is_low_byte_first ? high_byte_first : low_byte_first;

// One sub-ACL of every type, and a second mechanism; user and group entries in order.
inline const std::string rich = acl_bytes("g: Admins 17, staff 18; u unix: al 1, bob@host.example 2;"
                                          "e kRb5: z 4, a 5; u hba2: x 6; o: 7; n: 8");

} // namespace support

#endif
