// Entries as the verbs show them.
#ifndef QZACL_ENTRY_WORDS_H
#define QZACL_ENTRY_WORDS_H

#include "output.h"
#include "permission_set.h"
#include "qz/service.hpp"

#include <string>
#include <string_view>

namespace qzacl {

// The text with A to Z in lower case.
std::string folded(std::string_view text);

// Two entries of one key say something of the same party.
std::string key_of(const qz::entry_fields &entry);

// Appends "TYPE MECHANISM IDENTITY", as far as the entry has them.
void append_key(std::string &line, const qz::entry_fields &entry);

// Appends the key and the letters. Throws recorded_trouble for a bit without letter.
void append_entry(std::string &line, const qz::entry_fields &entry, const permission_set &set);

// Puts "file", "line", "type", "mechanism", "identity" and "permissions" into an object; null is what is empty but
// permissions, and a line 0.
void put_entry(json &object, const std::string &file, std::size_t line, const qz::entry_fields &entry,
               const permission_set &set);

// Writes the same objects, which is quicker where there may be a million.
class entry_json {
public:
    // The set outlives the writer.
    entry_json(const std::string &file, const permission_set &set);

    // Appends the object, without a line end. A mechanism stays what it is as long as it is at the same place.
    void append(std::string &line, std::size_t number, const qz::entry_fields &entry);

private:
    void name(std::uint8_t type, std::string_view mechanism);
    const std::string &end_of(std::uint32_t mask);

    // The parts of objects around the line and the identity, which most share; with the quotation marks of the identity.
    struct ending {
        std::uint32_t mask = 0;
        std::string text;
    };

    const permission_set &set_;
    std::string head_;
    std::string middle_;
    ending endings_[64];
    std::uint8_t type_ = 0; // of the middle, as the mechanism
    std::string_view mechanism_;
};

// Appends a number in decimal.
void append_number(std::string &line, std::size_t number);

// A record of the C interface that shows the fields, whose texts end in NUL. Throws trouble for a mechanism that
// none can hold.
sec_acle_t record_of(const qz::entry_fields &entry);

} // namespace qzacl

#endif
