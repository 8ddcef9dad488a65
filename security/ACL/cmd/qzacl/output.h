// The output of the verbs: lines for people, or JSON, one object per line.
#ifndef QZACL_OUTPUT_H
#define QZACL_OUTPUT_H

#include <deque>
#include <nlohmann/json.hpp>
#include <string>
#include <string_view>

namespace qzacl {

// Keys keep their order of insertion.
using json = nlohmann::ordered_json;

// A text as JSON can hold it: with U+FFFD for each byte that is not UTF-8.
json json_text(std::string_view bytes);
// True if JSON needs no escapes for the text.
bool is_plain_in_json(std::string_view bytes);
// Appends the same text as JSON, with its quotation marks.
void append_json_text(std::string &line, std::string_view bytes);

// The text with its control bytes as \xHH, except those in `kept`.
std::string escaped(std::string_view text, std::string_view kept);

// The bytes to collect before they are written.
inline constexpr std::size_t enough_to_write = 1 << 18;

// Lines that are held back until all of them are known, without ever being moved to a larger place.
class held_lines {
public:
    // Where the next line is to be appended, with its line feed.
    std::string &next() {
        if (parts_.empty() || parts_.back().size() >= enough_to_write)
            parts_.emplace_back().reserve(enough_to_write + enough_to_write / 8);
        return parts_.back();
    }

private:
    friend class output;
    std::deque<std::string> parts_;
};

// Lines as a descriptor shows them: unchanged or, on a terminal, with control bytes as \xHH except those in `kept`.
std::string shown_on(int fd, std::string_view lines, std::string_view kept = "\n");

// Standard output. On a terminal control bytes are shown as \xHH, so that no identity can move the cursor.
class output {
public:
    explicit output(bool is_json);

    bool is_json() const { return is_json_; }

    // Prints a line, to which the line end is added.
    void line(std::string_view text);
    // Prints lines that end in line feeds.
    void lines(std::string_view text);
    void lines(const held_lines &held);
    void object(const json &object);

    // Writes what was gathered; called once more at the end. Throws trouble when it cannot be written. After the reader
    // of a pipe has closed it, ends the process as SIGPIPE does.
    void flush();

private:
    void add(std::string_view text, std::string_view kept);
    static void write(std::string_view bytes);

    bool is_json_;
    bool is_terminal_;
    std::string gathered_;
};

} // namespace qzacl

#endif
