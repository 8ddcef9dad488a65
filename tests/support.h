// What the tests of the ACL library share: the recorded error as a value, compiled bytes written by hand,
// bytes that end at an inaccessible page, captured output, and folders that vanish.
#ifndef QZ_TESTS_SUPPORT_H
#define QZ_TESTS_SUPPORT_H

#include "msg/qzseclib_msg.h"
#include "qz/acl.h"
#include "qz/cu.h"

#include <cstring>
#include <filesystem>
#include <gtest/gtest.h>
#include <memory>
#include <sstream>
#include <string>
#include <sys/mman.h>
#include <vector>

namespace support {

using namespace std::literals;
using arguments = std::vector<std::string>;

struct failure {
    int code = 0, id = 0;
    std::string text = {};
    bool operator==(const failure &) const = default;
    friend std::ostream &operator<<(std::ostream &out, const failure &error) {
        return out << "code " << error.code << ", message " << error.id << ": " << error.text;
    }
};

// The error of this thread, which is cleared.
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

// The error that a message with these arguments, each as it is shown, would be recorded as.
inline failure error_of(int code, int id, const arguments &args = {}) {
    failure made{code, id, std::string(qz::msg::default_text(id))};
    for (std::size_t at = 0; (at = made.text.find('$', at)) != std::string::npos;) {
        const std::string &arg = args.at(static_cast<std::size_t>(made.text[at - 1] - '1'));
        at -= 2;
        made.text.replace(at, made.text.find_first_of("sdxc", at) + 1 - at, arg);
        at += arg.size();
    }
    return made;
}

// A pointer as the parameter message shows it.
inline std::string shown(const void *pointer) {
    std::ostringstream text;
    text << std::hex << static_cast<std::uint32_t>(reinterpret_cast<std::uintptr_t>(pointer));
    return text.str();
}

// A copy of bytes whose last one lies right before a page that nothing may touch.
class guarded {
public:
    explicit guarded(std::string_view bytes) : size_(bytes.size()) {
        const std::size_t page = (size_ | 4095) + 1;
        void *memory = mmap(nullptr, page + 4096, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
        char *const start = static_cast<char *>(memory);
        mprotect(start + page, 4096, PROT_NONE);
        bytes_ = {start + page - size_, [=](char *) { munmap(start, page + 4096); }};
        bytes.copy(data(), size_);
    }
    char *data() const { return bytes_.get(); }
    std::size_t size() const { return size_; }

private:
    std::size_t size_;
    std::shared_ptr<char> bytes_;
};

// What a call writes to standard output and to standard error.
using output = std::pair<std::string, std::string>;
output output_of(const auto &call) {
    testing::internal::CaptureStdout();
    testing::internal::CaptureStderr();
    call();
    return {testing::internal::GetCapturedStdout(), testing::internal::GetCapturedStderr()};
}

class temporary_folder {
public:
    temporary_folder() { EXPECT_NE(mkdtemp(path_.data()), nullptr); }
    temporary_folder(const temporary_folder &) = delete;
    ~temporary_folder() { std::filesystem::remove_all(path_); }
    std::string operator/(std::string_view name) const { return path_ + "/" + std::string(name); }
    const std::string &path() const { return path_; }

private:
    std::string path_ = std::filesystem::temp_directory_path() / ("qzacl-test-" + std::string(6, 'X'));
};

// An entry that borrows its texts.
inline sec_acle_t entry(int type, std::string_view mechanism, const char *identity, std::uint32_t mask) {
    sec_acle_t made = {mask, "", static_cast<std::uint8_t>(type), const_cast<char *>(identity)};
    mechanism.copy(made.mechanism, sizeof made.mechanism - 1);
    return made;
}

// Parts of a compiled buffer. Numbers stand low byte first; strings are given with their NUL.
inline std::string number(std::uint64_t value, std::size_t width) {
    return width == 0 ? "" : static_cast<char>(value & 0xff) + number(value >> 8, width - 1);
}
inline std::string packed_entry(std::uint32_t mask, std::string_view identity) {
    return "\1"s + number(mask, 4) + number(identity.size(), 2) + std::string(identity);
}
inline std::string packed_subacl(int type, std::string_view mechanism, std::uint64_t count,
                                 const std::string &entries) {
    return number(10 + mechanism.size() + entries.size(), 4) + static_cast<char>(type) + number(count, 4) +
           static_cast<char>(mechanism.size()) + std::string(mechanism) + entries;
}
inline std::string packed_acl(std::uint64_t count, const std::string &subacls) {
    return "\x85\1\2"s + number(count, 2) + subacls;
}

} // namespace support

#endif
