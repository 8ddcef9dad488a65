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

// Entries with the same key apply to the same party.
std::string key_of(const qz::entry_fields &entry);

// Appends "TYPE MECHANISM IDENTITY", as far as the entry has them.
void append_key(std::string &line, const qz::entry_fields &entry);

// Appends the key and the letters. Throws recorded_trouble for a bit without a letter.
void append_entry(std::string &line, const qz::entry_fields &entry, const permission_set &set);

// Puts "file", "line", "type", "mechanism", "identity" and "permissions" into an object. Empty texts other than
// permissions, and line 0, become null.
void put_entry(json &object, const std::string &file, std::size_t line, const qz::entry_fields &entry,
               const permission_set &set);

// Writes the same objects, faster: there may be a million.
class entry_json {
public:
    // The set outlives the writer.
    entry_json(const std::string &file, const permission_set &set);

    // Appends the object, without a line end. A mechanism at the same address must not change between calls.
    void append(std::string &line, std::size_t number, const qz::entry_fields &entry);

private:
    void name(std::uint8_t type, std::string_view mechanism);
    const std::string &end_of(std::uint32_t mask);

    // The parts of an object around the line and the identity, which most objects share; with the quotation marks of
    // the identity.
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

// A record of the C interface with the fields, whose texts must end in NUL. Throws trouble for a mechanism that is
// too long for one.
sec_acle_t record_of(const qz::entry_fields &entry);

} // namespace qzacl

#endif
