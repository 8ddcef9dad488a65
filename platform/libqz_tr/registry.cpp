// A table of fixed size. A named place keeps its name for the life of the process, so that recording threads can look
// components up without a lock. Places change only under the mutex.
#include "libqz_tr/registry.h"

#include "libqz_tr/environment.h"
#include "libqz_tr/levels.h"
#include "libqz_tr/text.h"
#include "libqz_tr/trace_file.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <pthread.h>

namespace qz::tr::registry {
namespace {

struct component_place {
    std::array<char, 64> name{};
    std::size_t name_length = 0;
    std::span<std::uint8_t> levels{}; // only under the mutex
    std::atomic<bool> registered{false};

    std::string_view name_view() const { return {name.data(), name_length}; }
};

constinit std::array<component_place, TR_COMPONENT_LIMIT> places{};
constinit std::atomic<std::size_t> named{0};
pthread_mutex_t mutex = PTHREAD_MUTEX_INITIALIZER;

void lock() { pthread_mutex_lock(&mutex); }
void unlock() { pthread_mutex_unlock(&mutex); }

// Otherwise a child forked while another thread holds the mutex would wait forever for a thread that it does not have.
// Done at load time, because a once-guard that a fork interrupts would do it twice.
[[gnu::constructor]] void keep_free_over_fork() { pthread_atfork(lock, unlock, unlock); }

class table_lock {
public:
    table_lock() { lock(); }
    ~table_lock() { unlock(); }
    table_lock(const table_lock &) = delete;
    table_lock &operator=(const table_lock &) = delete;
};

component_place *find_component(std::string_view name) {
    const auto end = places.begin() + named.load(std::memory_order_acquire);
    const auto found = std::find_if(places.begin(), end,
                                    [&](const component_place &place) { return place.name_view() == name; });
    return found == end ? nullptr : &*found;
}

// Under the mutex.
component_place *find_or_name(std::string_view name) {
    if (component_place *place = find_component(name))
        return place;
    const std::size_t next = named.load(std::memory_order_relaxed);
    if (next == places.size())
        return nullptr;
    std::copy(name.begin(), name.end(), places[next].name.begin());
    places[next].name_length = name.size();
    named.store(next + 1, std::memory_order_release);
    return &places[next];
}

// Atomic, because components read their levels without a lock.
void set_level(std::uint8_t &level, std::uint8_t value) { __atomic_store_n(&level, value, __ATOMIC_RELAXED); }

void clear(std::span<std::uint8_t> levels) {
    for (std::uint8_t &level : levels)
        set_level(level, 0);
}

} // namespace

int add(std::string_view name, std::span<std::uint8_t> levels, std::span<const tr_category_t> categories) {
    if (name.empty() || name.size() >= component_place{}.name.size() || !is_printable(name))
        return TR_BAD_PARAMETER;
    const table_lock locked;
    component_place *place = find_or_name(name);
    if (place == nullptr) {
        clear(levels);
        return TR_NO_MEMORY;
    }
    // Registered before any level is raised, so that no thread records too early.
    place->levels = levels;
    place->registered.store(true, std::memory_order_release);
    for (std::size_t index = 0; index < categories.size(); ++index) {
        const char *category = categories[index].name;
        const std::uint8_t level =
            category == nullptr ? std::uint8_t{0} : configured_level(environment().levels, name, category);
        // Without a level there must be no file.
        set_level(levels[index], level != 0 && trace_file::size() >= 0 ? level : std::uint8_t{0});
    }
    return TR_OK;
}

int remove(std::string_view name) {
    const table_lock locked;
    component_place *place = find_component(name);
    if (place == nullptr || !place->registered.load(std::memory_order_relaxed))
        return TR_NOT_REGISTERED;
    clear(place->levels);
    place->levels = {};
    place->registered.store(false, std::memory_order_release);
    return TR_OK;
}

bool contains(std::string_view name) {
    const component_place *place = find_component(name);
    return place != nullptr && place->registered.load(std::memory_order_acquire);
}

} // namespace qz::tr::registry
