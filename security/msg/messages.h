// The messages of the library and the command, each declared once with the types of its arguments. Recording a message
// with other arguments does not compile, nor does a declaration that contradicts its text.
#ifndef QZ_MESSAGES_H
#define QZ_MESSAGES_H

#include "msg/qzseclib_msg.h"

#include <type_traits>

namespace qz::msg {

// The conversion letter for a position, such as the d in "%2$d" or the x in "0x%1$08x". 0 if the text does not use the
// position, '!' if it uses it with different letters.
constexpr char conversion_of(std::string_view text, std::size_t position) {
    char found = 0;
    for (std::size_t at = 0; at + 3 < text.size(); ++at) {
        if (text[at] != '%' || text[at + 1] != static_cast<char>('0' + position) || text[at + 2] != '$')
            continue;
        std::size_t letter = at + 3;
        while (letter < text.size() && text[letter] >= '0' && text[letter] <= '9')
            ++letter;
        if (letter == text.size() || (found != 0 && found != text[letter]))
            return '!';
        found = text[letter];
    }
    return found;
}

template <class Arg>
constexpr bool accepts(char conversion) {
    if constexpr (std::is_same_v<Arg, const char *>)
        return conversion == 's';
    else
        return std::is_same_v<Arg, int> && (conversion == 'd' || conversion == 'x' || conversion == 'c');
}

template <class... Args>
constexpr bool arguments_fit(std::string_view text) {
    std::size_t position = 0;
    return (accepts<Args>(conversion_of(text, ++position)) && ...) &&
           conversion_of(text, sizeof...(Args) + 1) == 0;
}

template <int Id, class... Args>
struct message {
    static_assert(!default_text(Id).empty(), "the message has a text");
    static_assert(arguments_fit<Args...>(default_text(Id)), "the arguments are those of the text");
    static constexpr int id = Id;
};

// The command.
inline constexpr message<80> usage;
inline constexpr message<81> help;
inline constexpr message<146, const char *> option_repeated;
inline constexpr message<147> option_incorrect;
inline constexpr message<148> file_option_missing;
inline constexpr message<149> stream_not_implemented;
inline constexpr message<150> compile_option_ignored;
inline constexpr message<154, const char *, int> bad_acl_file_name;
inline constexpr message<155, const char *, const char *> acl_file_not_private;
inline constexpr message<156, const char *, int> cannot_open_acl_file;
inline constexpr message<157, const char *> acl_file_empty;
inline constexpr message<162> cache_skipped_after_errors;

// Shared by all operations.
inline constexpr message<88, const char *, int, int> incorrect_parameter;
inline constexpr message<89, const char *, int> no_memory;
inline constexpr message<91, const char *, int, int> internal_failure;

// Code sets.
inline constexpr message<129> conversion_unavailable;
inline constexpr message<130> conversion_failed;

// Entries and permissions.
inline constexpr message<94, int> acle_type_not_displayable;
inline constexpr message<95> acle_incomplete;
inline constexpr message<133, int> no_template_for_letter;
inline constexpr message<164, int> no_template_for_bit;

// The text of an ACL file.
inline constexpr message<131, int> line_corrupted;
inline constexpr message<132, const char *, int> mechanism_too_long;
inline constexpr message<145, int> line_too_long;
inline constexpr message<158, int> tokens_missing;
inline constexpr message<159, int> tokens_in_excess;
inline constexpr message<165, int, const char *> bad_type_token;
inline constexpr message<166, int, const char *> bad_permission_token;

// Trees.
inline constexpr message<105, int, const char *, const char *> acle_not_found;
inline constexpr message<144, int, const char *, const char *> duplicate_acle;
inline constexpr message<160, int> duplicate_single_acle;
inline constexpr message<161, int, const char *> duplicate_group;

// Compiled buffers. The last two arguments of a located message are the source path and the line of the
// check.
inline constexpr message<93> acl_corrupted;
inline constexpr message<96> not_an_acl_buffer;
inline constexpr message<97, const char *, int> buffer_corrupted;
inline constexpr message<98> single_acle_repeated;
inline constexpr message<106, int, const char *, int> shorter_than_header;
inline constexpr message<107, int, const char *, int> subacl_type_unknown;
inline constexpr message<108, int, const char *, int> subacl_takes_no_mechanism;
inline constexpr message<109, const char *, int> more_than_one_acle;
inline constexpr message<110, int, const char *, int> bad_mechanism_length;
inline constexpr message<111, const char *, const char *, int> bad_mechanism;
inline constexpr message<112, int, const char *, int> acle_version_unsupported;
inline constexpr message<113, const char *, int> unexpected_identity;
inline constexpr message<114, const char *, int> bad_identity_length;

// Editing.
inline constexpr message<100> second_argument_not_acl;
inline constexpr message<101> buffer_version_unsupported;
inline constexpr message<102> wrong_byte_order;
inline constexpr message<103, int> acle_type_unknown;
inline constexpr message<104, int> acle_lacks_key;

// Evaluation and identity handlers.
inline constexpr message<115, int> type_not_evaluated;
inline constexpr message<116> mechanism_required;
inline constexpr message<117> identity_required;
inline constexpr message<118, const char *, int, int> state_lock_failed;
inline constexpr message<119> bad_handler_mechanism;
inline constexpr message<134, int, const char *, const char *> no_matching_acle;

// ACL files and their caches.
inline constexpr message<121> bad_user_name;
inline constexpr message<122, const char *, int> bad_file_name;
inline constexpr message<124, const char *, int> cannot_open_file;
inline constexpr message<126, int, int, int> short_read;
inline constexpr message<127, const char *> unknown_user;
inline constexpr message<128, const char *, const char *> file_not_private;
inline constexpr message<135, const char *> name_too_long_for_cache;
inline constexpr message<136, const char *> cache_owner_differs;
inline constexpr message<137, const char *> cache_mode_differs;
inline constexpr message<138, const char *> cannot_open_for_writing;
inline constexpr message<139, int, int, int> short_write;
inline constexpr message<141, const char *, const char *, int> cannot_set_owner;
inline constexpr message<142, const char *, int> cannot_set_mode;
inline constexpr message<151, const char *, const char *> path_with_user_name;
inline constexpr message<152, const char *, int> working_directory_unknown;
inline constexpr message<153, const char *, const char *> working_directory_too_long;
inline constexpr message<163, const char *, const char *> cannot_rename_cache;

// Lines of the dump.
inline constexpr message<82> dump_not_valid;
inline constexpr message<83, const char *, int, int, int> dump_descriptor;
inline constexpr message<84, const char *, const char *, int, int, const char *, int> dump_subacl;
inline constexpr message<85, const char *, int, const char *, const char *, const char *> dump_mechanism_acle;
inline constexpr message<86, const char *, int, const char *, const char *> dump_group_acle;
inline constexpr message<87, const char *, int, const char *> dump_single_acle;

} // namespace qz::msg

#endif
