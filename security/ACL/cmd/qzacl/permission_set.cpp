// The permissions that entries are read and shown with.
#include "permission_set.h"

#include "trouble.h"
#include "whole_file.h"

#include <bit>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <sstream>

namespace qzacl {

namespace {

std::uint32_t bit_of(const std::string &number) {
    char *end = nullptr;
    errno = 0;
    const unsigned long long bit = std::strtoull(number.c_str(), &end, 0);
    const bool is_number = number[0] >= '0' && number[0] <= '9' && *end == '\0' && errno == 0;
    if (!is_number || bit > UINT32_MAX || !std::has_single_bit(bit))
        throw trouble("\"" + number + "\" is not one bit of 32");
    return static_cast<std::uint32_t>(bit);
}

template <std::size_t Size>
void copy_text(char (&to)[Size], const std::string &text, const char *what) {
    if (text.size() >= Size)
        throw trouble(std::string(what) + " has more than " + std::to_string(Size - 1) + " bytes");
    text.copy(to, Size - 1);
}

sec_perm_template_t template_of(const std::string &letter, std::istringstream &words) {
    sec_perm_template_t made = {};
    std::string bit;
    std::string name;
    std::string description;
    if (letter.size() != 1)
        throw trouble("\"" + letter + "\" is not one letter");
    if (!(words >> bit))
        throw trouble("the bit is missing");
    words >> name >> std::ws;
    std::getline(words, description);
    description.erase(description.find_last_not_of(" \t\r") + 1);
    made.letter = letter[0];
    made.bit = bit_of(bit);
    copy_text(made.name, name, "the name");
    copy_text(made.description, description, "the description");
    return made;
}

} // namespace

permission_set::permission_set(const std::string &file) {
    std::istringstream lines(read_whole(file));
    std::string line;
    for (std::size_t number = 1; std::getline(lines, line); ++number) {
        std::istringstream words(line);
        std::string letter;
        if (!(words >> letter) || letter[0] == '#')
            continue;
        try {
            templates_.push_back(template_of(letter, words));
        } catch (const trouble &found) {
            throw trouble(file + ":" + std::to_string(number) + ": " + found.what());
        }
    }
    if (templates_.empty())
        throw trouble(file + ": has no permission");
    set_ = {static_cast<std::int32_t>(templates_.size()), templates_.data()};
}

std::uint32_t permission_set::mask_of(const std::string &letters) const {
    if (letters.empty())
        throw wrong_use("LETTERS is empty");
    std::uint32_t mask = 0;
    require(sec_translate_perms(letters.c_str(), get(), &mask));
    return mask;
}

std::string_view permission_set::letters_of(std::uint32_t mask) const {
    if (mask != last_mask_) {
        last_mask_ = 0;
        last_size_ = 0;
        require(sec_translate_bitmask(mask, get(), last_letters_));
        last_size_ = std::strlen(last_letters_);
        last_mask_ = mask;
    }
    return {last_letters_, last_size_};
}

} // namespace qzacl
