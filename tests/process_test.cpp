// State of the whole process: registration for tracing, and forks. The child of a fork can use each library, even if
// another thread of its parent held the library's lock.
#include "qzacl_trace.h"
#include "support.h"

#include <atomic>
#include <semaphore>
#include <thread>

using namespace support;

// One thread stops in the library with its lock held, while the process forks or has to wait for the lock.
struct stop_with_lock_held {
    void here() {
        is_holding.release();
        std::this_thread::sleep_for(std::chrono::milliseconds(200));
    }
    std::binary_semaphore is_holding{0};
};
static thread_local stop_with_lock_held *stop = nullptr;

static int sizes_asked = 0;
static int names_asked = 0;

// The linker leads the libraries' calls here.
extern "C" int __real_pthread_mutex_unlock(pthread_mutex_t *mutex);
extern "C" int __wrap_pthread_mutex_unlock(pthread_mutex_t *mutex) {
    if (stop_with_lock_held *held = std::exchange(stop, nullptr))
        held->here();
    return __real_pthread_mutex_unlock(mutex);
}
extern "C" int __real_tr_get_size_1(std::uint32_t *size);
extern "C" int __wrap_tr_get_size_1(std::uint32_t *size) {
    ++sizes_asked;
    return __real_tr_get_size_1(size);
}
extern "C" int __real_tr_get_filename_1(char *name);
extern "C" int __wrap_tr_get_filename_1(char *name) {
    ++names_asked;
    return __real_tr_get_filename_1(name);
}

namespace {

// The configuration is read once, so that each row has a process of its own.
TEST(registration, asks_for_the_trace_file_when_times_are_traced) {
    const temporary_folder folder;
    for (const auto &[levels, times] : {std::pair("_SEL:Perf=1", 1), {"_SEL:Perf=5", 0}, {"_SEL:API=1", 0}}) {
        const int status = status_of_child([&, levels = levels, times = times] {
            setenv("QZ_TRACE_LEVELS", levels, 1);
            setenv("QZ_TRACE_FILE", (folder / "trace").c_str(), 1);
            acl__trace_register_component();
            _exit(sizes_asked == times && names_asked == times ? 0 : 1);
        });
        EXPECT_EQ(status, 0) << levels;
    }
}

bool looks_up_a_handler() {
    const buffer acl(rich);
    std::uint32_t mask = 0;
    return sec__single_acle_perm(&acl.acl, by_handler, "unix", nullptr, "al", &mask) == SEC_S_OK && mask == 1;
}
// Each time from another catalog, which is opened under the lock.
bool fetches_a_text() {
    static std::atomic<int> number = 0;
    const std::string catalog = "none-" + std::to_string(++number) + ".cat";
    cu_set_error_1(4, 0, catalog.c_str(), 1, 1, "text");
    return recorded_error().text == "text";
}
bool registers_for_tracing() {
    std::uint8_t level = 1;
    const tr_category_t category = {0, "Any", 0};
    return tr_register_component_1("fork_test", &level, &category, 1) == TR_OK;
}

TEST(fork, leaves_a_child_that_can_use_the_libraries) {
    const std::pair<const char *, bool (*)()> uses[] = {
        {"libqzacl", looks_up_a_handler}, {"libqz_cu", fetches_a_text}, {"libqz_tr", registers_for_tracing}};
    for (const auto &[library, use] : uses) {
        SCOPED_TRACE(library);
        ASSERT_TRUE(use()); // first-time work is done
        stop_with_lock_held held;
        std::thread holder([&held, use = use] {
            stop = &held;
            use();
        });
        held.is_holding.acquire();
        const int status = status_of_child([use = use] {
            alarm(10); // ends a child that waits for a holder that it does not have
            _exit(use() ? 0 : 1);
        });
        holder.join();
        EXPECT_EQ(status, 0);
        EXPECT_TRUE(use());
    }
}

} // namespace
