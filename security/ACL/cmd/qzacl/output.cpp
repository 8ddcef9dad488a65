// The output of the verbs.
#include "output.h"

#include "trouble.h"
#include "utf8.h"
#include "whole_file.h"

#include <cerrno>
#include <csignal>
#include <cstring>
#include <unistd.h>

namespace qzacl {

namespace {

// C0, DEL, and C1 as UTF-8 has them, which terminals obey as well.
bool is_control(std::string_view text, std::size_t at) {
    const auto byte = static_cast<unsigned char>(text[at]);
    const auto before = at == 0 ? '\0' : text[at - 1];
    return byte < 0x20 || byte == 0x7f || (before == '\xc2' && byte >= 0x80 && byte < 0xa0);
}

[[noreturn]] void end_quietly() {
    std::signal(SIGPIPE, SIG_DFL);
    std::raise(SIGPIPE);
    _exit(failed);
}

} // namespace

std::string escaped(std::string_view text, std::string_view kept) {
    constexpr char digits[] = "0123456789abcdef";
    std::string shown;
    for (std::size_t at = 0; at < text.size(); ++at) {
        const auto byte = static_cast<unsigned char>(text[at]);
        if (!is_control(text, at) || kept.find(text[at]) != std::string_view::npos) {
            shown += text[at];
            continue;
        }
        if (byte >= 0x80) {
            shown.pop_back();
            shown += "\\xc2";
        }
        shown.append("\\x").append({digits[byte >> 4], digits[byte & 15]});
    }
    return shown;
}

std::string shown_on(int fd, std::string_view lines, std::string_view kept) {
    return isatty(fd) == 0 ? std::string(lines) : escaped(lines, kept);
}

json json_text(std::string_view bytes) { return valid_utf8(bytes); }

// Does not stop early, so that several bytes are compared at once.
bool is_plain_in_json(std::string_view bytes) {
    bool is_plain = true;
    for (const char c : bytes)
        is_plain = is_plain & (c >= ' ' && c <= '~' && c != '"' && c != '\\');
    return is_plain;
}

void append_json_text(std::string &line, std::string_view bytes) {
    if (is_plain_in_json(bytes))
        line.append(1, '"').append(bytes).append(1, '"');
    else
        line += json_text(bytes).dump();
}

output::output(bool is_json) : is_json_(is_json), is_terminal_(isatty(STDOUT_FILENO) != 0) {}

void output::add(std::string_view text, std::string_view kept) {
    if (is_terminal_)
        gathered_ += escaped(text, kept);
    else
        gathered_ += text;
}

void output::line(std::string_view text) {
    add(text, "");
    gathered_ += '\n';
    if (gathered_.size() >= enough_to_write)
        flush();
}

void output::lines(std::string_view text) {
    if (text.size() >= enough_to_write && !is_terminal_) {
        flush();
        return write(text);
    }
    add(text, "\n");
    if (gathered_.size() >= enough_to_write)
        flush();
}

void output::lines(const held_lines &held) {
    for (const std::string &part : held.parts_)
        lines(part);
}

void output::object(const json &object) { line(object.dump(-1, ' ', false, json::error_handler_t::replace)); }

void output::flush() {
    write(gathered_);
    gathered_.clear();
}

void output::write(std::string_view bytes) {
    if (write_all(STDOUT_FILENO, bytes))
        return;
    if (errno == EPIPE)
        end_quietly();
    throw trouble(std::string("standard output: ") + std::strerror(errno));
}

} // namespace qzacl
