// Files that are read whole.
#include "input.h"

#include "base/open_file.h"
#include "trouble.h"

#include <cerrno>
#include <cstring>
#include <unistd.h>

namespace qzacl {

namespace {

[[noreturn]] void fail(const std::string &name) { throw trouble(name + ": " + std::strerror(errno)); }

} // namespace

std::string read_whole(const std::string &name) {
    if (name == standard_input)
        return read_whole(STDIN_FILENO, name);
    const qz::descriptor opened = qz::open_file(name.c_str(), O_RDONLY);
    if (!opened)
        fail(name);
    return read_whole(opened.get(), name);
}

std::string read_whole(int fd, const std::string &name) {
    std::string bytes;
    constexpr std::size_t step = 1 << 18;
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

} // namespace qzacl
