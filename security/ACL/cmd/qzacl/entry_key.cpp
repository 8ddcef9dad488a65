// The key of an entry, from the words of a command line.
#include "entry_key.h"

#include "base/posix_fold.h"
#include "entry_words.h"
#include "qz/acl.h"
#include "qz/cu.h"
#include "qzacl_acl/entry.h"
#include "qzacl_acl/entry_parser.h"
#include "qzacl_acl/line_words.h"
#include "trouble.h"

#include <algorithm>
#include <cctype>
#include <memory>

using namespace qz;

namespace qzacl {

namespace {

char folded_byte(char c) { return static_cast<char>(fold(static_cast<unsigned char>(c))); }

std::uint8_t type_of(std::string_view word) {
    constexpr std::uint8_t types[] = {SEC_ACLE_UNAUTHENTICATED, SEC_ACLE_ANYOTHER, SEC_ACLE_USER,
                                      SEC_ACLE_EXPANDED, SEC_ACLE_GROUP};
    for (const std::uint8_t type : types) {
        if (word.size() == 1 && folded_byte(word[0]) == type_letter(type))
            return type;
    }
    return 0;
}

// True if the parser reads the word back as one word.
bool is_word(const std::string &word) {
    std::string line = word;
    line_words tokens(line.data(), line.data() + line.size());
    line_word first;
    return word.find_first_of(std::string_view("\n\f\r\0", 4)) == std::string::npos && tokens.next(first) &&
           first.length == word.size();
}

struct release_acle {
    void operator()(sec_acle_t *acle) const { sec_release_acle(acle); }
};

// Bytes beyond ASCII affect neither what is refused nor how a host is stored, but the library would read them in the
// code set of the locale. So each is replaced by an 'x' while the library examines a text.
std::string plain(std::string text) {
    std::replace_if(
        text.begin(), text.end(), [](char c) { return static_cast<unsigned char>(c) > 0x7f; }, 'x');
    return text;
}

void find_stored_form(entry_key &key) {
    key.stored = key.identity;
    if (!has_identity(key.type))
        return;
    const std::string identity = plain(key.identity);
    sec_acle_t *made = nullptr;
    key.is_refused =
        sec_create_acle(key.type, 0, plain(key.mechanism).c_str(), identity.c_str(), &made) != SEC_S_OK;
    const std::unique_ptr<sec_acle_t, release_acle> owner(made);
    cu_set_no_error_1();
    if (key.is_refused || identity == made->identity)
        return;
    // The part before the host stays as the caller wrote it.
    const std::size_t at = identity.find('@');
    const std::size_t host = at == std::string::npos ? 0 : at + 1;
    key.stored.resize(host);
    key.stored += std::string_view(made->identity).substr(host);
}

} // namespace

void read_entry_key(std::span<const std::string> words, entry_key &key, std::string *letters) {
    const auto not_a_word = std::find_if_not(words.begin(), words.end(), is_word);
    if (not_a_word != words.end())
        throw wrong_use("\"" + *not_a_word + "\" cannot be a word of a line");
    key.type = words.empty() ? std::uint8_t{0} : type_of(words[0]);
    if (key.type == 0)
        throw wrong_use("an entry begins with n, o, u, e or g");

    const std::size_t needed = 1U + (has_mechanism(key.type) ? 1U : 0U) + (has_identity(key.type) ? 1U : 0U);
    if (words.size() < needed)
        throw wrong_use("words are missing behind \"" + words.back() + "\"");
    if (words.size() > needed + (letters == nullptr ? 0U : 1U))
        throw wrong_use("\"" + words.back() + "\" is a word too many");
    if (has_mechanism(key.type)) {
        key.mechanism = folded(words[1]);
        if (key.mechanism.size() > mechanism_max)
            throw wrong_use("\"" + words[1] + "\" is longer than the 16 bytes of a mechanism");
    }
    if (has_identity(key.type))
        key.identity = words[needed - 1];
    if (letters != nullptr && words.size() > needed)
        *letters = words[needed];
    find_stored_form(key);
}

std::string line_of(const entry_key &key, std::uint32_t permissions, const permission_set &set) {
    std::string line;
    append_entry(line, {key.type, permissions, key.mechanism, key.stored}, set);
    return line;
}

bool same_identity(std::string_view one, std::string_view other) {
    const auto is_same = [](char a, char b) { return folded_byte(a) == folded_byte(b); };
    return std::equal(one.begin(), one.end(), other.begin(), other.end(), is_same);
}

} // namespace qzacl
