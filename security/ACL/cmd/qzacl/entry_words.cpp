// Entries as the verbs show them.
#include "entry_words.h"

#include "trouble.h"

#include <charconv>
#include <iterator>

using namespace qz;

namespace qzacl {

namespace {

char folded(char c) { return static_cast<char>(detail::fold(c)); }

json text_or_null(std::string_view text) { return text.empty() ? json() : json_text(text); }

} // namespace

std::string folded(std::string_view text) {
    std::string made(text);
    for (char &each : made)
        each = folded(each);
    return made;
}

std::string key_of(const entry_fields &entry) {
    std::string key(1, type_letter(entry.type));
    key += folded(entry.mechanism);
    key += '\0';
    key += folded(entry.identity);
    return key;
}

void append_key(std::string &line, const entry_fields &entry) {
    line += type_letter(entry.type);
    if (!entry.mechanism.empty()) {
        line.append(" ").append(entry.mechanism);
        for (std::size_t at = line.size() - entry.mechanism.size(); at < line.size(); ++at)
            line[at] = folded(line[at]);
    }
    if (!entry.identity.empty())
        line.append(" ").append(entry.identity);
}

void append_entry(std::string &line, const entry_fields &entry, const permission_set &set) {
    const std::string_view letters = set.letters_of(entry.permissions);
    append_key(line, entry);
    if (!letters.empty())
        line.append(" ").append(letters);
}

void put_entry(json &object, const std::string &file, std::size_t line, const entry_fields &entry,
               const permission_set &set) {
    object["file"] = json_text(file);
    object["line"] = line != 0 ? json(line) : json();
    object["type"] = std::string(1, type_letter(entry.type));
    object["mechanism"] = text_or_null(folded(entry.mechanism));
    object["identity"] = text_or_null(entry.identity);
    object["permissions"] = json_text(set.letters_of(entry.permissions));
}

entry_json::entry_json(const std::string &file, const permission_set &set) : set_(set), head_("{\"file\":") {
    append_json_text(head_, file);
    head_ += ",\"line\":";
}

void entry_json::append(std::string &line, std::size_t number, const entry_fields &entry) {
    if (entry.type != type_ || entry.mechanism.data() != mechanism_.data())
        name(entry.type, entry.mechanism);
    line += head_;
    if (number != 0)
        append_number(line, number);
    else
        line += "null";
    const std::string &end = end_of(entry.permissions);
    if (!entry.identity.empty() && is_plain_in_json(entry.identity)) {
        line.append(middle_).append(entry.identity).append(end);
        return;
    }
    line.append(middle_, 0, middle_.size() - 1);
    line.append(text_or_null(entry.identity).dump()).append(end, 1);
}

void entry_json::name(std::uint8_t type, std::string_view mechanism) {
    type_ = type;
    mechanism_ = mechanism;
    middle_ = ",\"type\":\"";
    middle_.append(1, type_letter(type)).append("\",\"mechanism\":");
    middle_.append(text_or_null(folded(mechanism)).dump()).append(",\"identity\":\"");
}

const std::string &entry_json::end_of(std::uint32_t mask) {
    ending &found = endings_[mask % std::size(endings_)];
    if (found.text.empty() || found.mask != mask) {
        found = {mask, "\",\"permissions\":"};
        append_json_text(found.text, set_.letters_of(mask));
        found.text += '}';
    }
    return found.text;
}

void append_number(std::string &line, std::size_t number) {
    char digits[24];
    const auto end = std::to_chars(std::begin(digits), std::end(digits), number).ptr;
    line.append(digits, static_cast<std::size_t>(end - digits));
}

sec_acle_t record_of(const entry_fields &entry) {
    sec_acle_t record = {};
    if (entry.mechanism.size() >= sizeof record.mechanism)
        throw trouble("a mechanism has more than 16 bytes");
    entry.mechanism.copy(record.mechanism, sizeof record.mechanism - 1);
    record.perm_mask = entry.permissions;
    record.type = entry.type;
    const bool has_identity = (entry.type & (SEC_ACLE_USER | SEC_ACLE_EXPANDED | SEC_ACLE_GROUP)) != 0;
    record.identity = has_identity ? const_cast<char *>(entry.identity.data()) : nullptr;
    return record;
}

} // namespace qzacl
