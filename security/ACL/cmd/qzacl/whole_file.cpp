// Files that are read and written whole.
#include "whole_file.h"

#include "base/open_file.h"
#include "trouble.h"

#include <cerrno>
#include <cstring>
#include <sys/stat.h>
#include <unistd.h>

using namespace qz;

namespace qzacl {

namespace {

[[noreturn]] void fail(const std::string &name) { throw trouble(name + ": " + std::strerror(errno)); }

} // namespace

std::string read_whole(const std::string &name) {
    if (name == standard_input)
        return read_whole(STDIN_FILENO, name);
    const descriptor opened = open_file(name.c_str(), O_RDONLY);
    if (!opened)
        fail(name);
    return read_whole(opened.get(), name);
}

std::string read_whole(int fd, const std::string &name) {
    std::string bytes;
    constexpr std::size_t step = 1 << 18;
    // A file that memory cannot hold fails before it has filled it.
    struct stat status = {};
    if (fstat(fd, &status) == 0 && S_ISREG(status.st_mode))
        bytes.reserve(static_cast<std::size_t>(status.st_size) + step);
    for (;;) {
        const std::size_t before = bytes.size();
        bytes.resize(before + step);
        const ssize_t count = read(fd, bytes.data() + before, step);
        if (count < 0 && errno != EINTR)
            fail(name);
        bytes.resize(before + (count > 0 ? static_cast<std::size_t>(count) : 0));
        if (count == 0)
            return bytes;
    }
}

int read_acl_text(const std::string &path, vetted_file &file, acl_text &text) {
    return text.open_again_while_replaced([&] {
        const int found = vet_acl_file(path.c_str(), nullptr, by_commands, file);
        return found != SEC_S_OK ? found : text.open(file, by_commands);
    });
}

bool write_all(int fd, std::string_view bytes) {
    while (!bytes.empty()) {
        const ssize_t count = write(fd, bytes.data(), bytes.size());
        if (count < 0 && errno != EINTR)
            return false;
        bytes.remove_prefix(count > 0 ? static_cast<std::size_t>(count) : 0);
    }
    return true;
}

} // namespace qzacl
