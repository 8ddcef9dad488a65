// The error facility: each thread's current error, recorded unformatted. Its text is made when it is fetched.
#include "base/kept_errno.h"
#include "base/owned.h"
#include "libqz_cu/catalog.h"
#include "libqz_cu/message_text.h"
#include "qz/cu.h"

#include <algorithm>
#include <bit>
#include <cstdarg>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <pthread.h>
#include <type_traits>

namespace qz::cu {
namespace {

struct recorded_error {
    cu_error_t head; // first, because a handle points to it
    bool present;    // false: no error; ignore the rest
    int set;
    const char *catalog;
    const char *default_text;
    arguments given;
};
static_assert(std::is_standard_layout_v<recorded_error>);

struct thread_record {
    recorded_error error;
    char *spill; // the strings that do not fit into the room
    char room[512];
};

// With initial-exec, accessing the record takes one instruction and no call into the dynamic linker. Such storage is
// scarce for libraries loaded late, hence the small room.
constinit thread_local thread_record current [[gnu::tls_model("initial-exec")]] = {};

pthread_once_t spill_once = PTHREAD_ONCE_INIT;
constinit pthread_key_t spill_key = {};
constinit bool has_spill_key = false;

void drop_spill() {
    std::free(current.spill);
    current.spill = nullptr;
}

// Runs at thread exit, perhaps before other destructors that use the current error.
void end_of_thread(void *) {
    current.error.present = false;
    drop_spill();
}

void make_spill_key() { has_spill_key = pthread_key_create(&spill_key, end_of_thread) == 0; }

[[gnu::cold, gnu::noinline]] bool take_spill(std::size_t size) {
    const kept_errno kept;
    pthread_once(&spill_once, make_spill_key);
    if (!has_spill_key || pthread_setspecific(spill_key, &current) != 0)
        return false;
    current.spill = static_cast<char *>(std::malloc(size));
    return current.spill != nullptr;
}

// The size of a string with its NUL. A null string takes none.
std::size_t bytes_of(const char *text) { return text != nullptr ? std::strlen(text) + 1 : 0; }

// Copies the strings from position `first` on into the room, truncating what does not fit.
void pack_strings(arguments &given, unsigned first, char *room, std::size_t left) {
    for (unsigned i = first; i < given.count; ++i) {
        if (!given.is_string(i) || given.values[i].text == nullptr)
            continue;
        const std::size_t taken = std::min(bytes_of(given.values[i].text), left);
        if (taken == 0) {
            given.values[i].text = "";
            continue;
        }
        std::memcpy(room, given.values[i].text, taken - 1);
        room[taken - 1] = 0;
        given.values[i].text = room;
        room += taken;
        left -= taken;
    }
}

std::size_t string_bytes(const arguments &given, unsigned first) {
    std::size_t total = 0;
    for (unsigned i = first; i < given.count; ++i)
        if (given.is_string(i))
            total += bytes_of(given.values[i].text);
    return total;
}

// Stores the strings from `first` on, which exceed the rest of the room.
[[gnu::cold, gnu::noinline]] void keep_long_strings(unsigned first, char *room, std::size_t left) {
    const std::size_t total = string_bytes(current.error.given, first);
    if (take_spill(total))
        pack_strings(current.error.given, first, current.spill, total);
    else
        pack_strings(current.error.given, first, room, left);
}

// Copies the strings that a new record points to.
void keep_strings() {
    if (current.spill != nullptr) [[unlikely]]
        drop_spill();
    arguments &given = current.error.given;
    char *room = current.room;
    std::size_t left = sizeof current.room;
    for (unsigned strings = given.strings; strings != 0; strings &= strings - 1) {
        const auto i = static_cast<unsigned>(std::countr_zero(strings));
        const std::size_t taken = bytes_of(given.values[i].text);
        if (taken > left) [[unlikely]] {
            keep_long_strings(i, room, left);
            return;
        }
        if (taken != 0) {
            given.values[i].text = static_cast<char *>(std::memcpy(room, given.values[i].text, taken));
            room += taken;
            left -= taken;
        }
    }
}

const recorded_error &record_of(const cu_error_t *handle) {
    return *reinterpret_cast<const recorded_error *>(handle);
}

// The text of a recorded error: the catalog's if its conversions fit the arguments, else the default.
const char *text_of(const recorded_error &error) {
    const char *by_default = error.default_text != nullptr ? error.default_text : "";
    if (error.catalog == nullptr)
        return by_default;
    const char *offered = catalog_text(error.catalog, error.set, error.head.message_id);
    // A translation may leave a text empty. The default is more use.
    return offered != nullptr && *offered != '\0' && has_conversions_of(offered, by_default) ? offered
                                                                                             : by_default;
}

} // namespace
} // namespace qz::cu

using namespace qz::cu;
using qz::allocate;
using qz::kept_errno;
using qz::owned;

int cu_set_error_1(int code, int, const char *catalog, int set, int message_id, const char *default_text,
                   ...) {
    recorded_error &error = current.error;
    // A catalog message has one text for the life of the process, so its arguments need not be found again when it
    // recurs, as those of denials do.
    const bool is_known = catalog != nullptr && default_text != nullptr && catalog == error.catalog &&
                          set == error.set && message_id == error.head.message_id &&
                          default_text == error.default_text;
    error.head = {code, message_id};
    error.present = true;
    error.set = set;
    error.catalog = catalog;
    if (!is_known) {
        error.default_text = default_text;
        find_arguments(default_text != nullptr ? default_text : "", error.given);
    }

    va_list given;
    va_start(given, default_text);
    for (unsigned i = 0; i < error.given.count; ++i) {
        if (error.given.is_string(i))
            error.given.values[i].text = va_arg(given, const char *);
        else
            error.given.values[i].number = va_arg(given, int);
    }
    va_end(given);
    keep_strings();
    return CU_OK;
}

int cu_set_no_error_1(void) {
    current.error.present = false;
    return CU_OK;
}

int cu_get_error_1(cu_error_t **error) {
    if (error == nullptr)
        return CU_BAD_PARAMETER;
    const kept_errno kept;
    const recorded_error from = current.error.present ? current.error : recorded_error{};
    const std::size_t bytes = string_bytes(from.given, 0);
    void *block = std::malloc(sizeof from + bytes);
    if (block == nullptr) {
        *error = nullptr;
        return CU_NO_MEMORY;
    }
    auto *copy = static_cast<recorded_error *>(std::memcpy(block, &from, sizeof from));
    pack_strings(copy->given, 0, static_cast<char *>(block) + sizeof from, bytes);
    *error = &copy->head;
    return CU_OK;
}

int cu_get_errmsg_1(const cu_error_t *error, char **text) {
    if (text == nullptr)
        return CU_BAD_PARAMETER;
    *text = nullptr;
    if (error == nullptr)
        return CU_BAD_PARAMETER;
    const kept_errno kept;
    const recorded_error &from = record_of(error);
    const char *shown = from.present ? text_of(from) : "";
    // Most texts fit into this and are formatted only once. What remains of the block is freed with the text.
    constexpr std::size_t room = 512;
    owned<char[]> made = allocate<char>(room);
    if (made == nullptr)
        return CU_NO_MEMORY;
    const std::size_t size = format_text(shown, from.given, made.get(), room);
    if (size > room) {
        made = allocate<char>(size);
        if (made == nullptr)
            return CU_NO_MEMORY;
        format_text(shown, from.given, made.get(), size);
    }
    *text = made.release();
    return CU_OK;
}

int cu_pset_error_1(const cu_error_t *error) {
    if (error == nullptr)
        return CU_BAD_PARAMETER;
    current.error = record_of(error);
    keep_strings();
    return CU_OK;
}

void cu_rel_error_1(cu_error_t *error) { std::free(error); }

void cu_rel_errmsg_1(char *text) { std::free(text); }
