/*
 * A lock that is free in the child of a fork: the part of <qz/service.hpp> that live_acl needs. Nothing here is
 * for callers.
 */
#ifndef QZ_FORK_LOCK_HPP
#define QZ_FORK_LOCK_HPP

#include <atomic>
#include <cstdint>
#include <mutex>
#include <new>
#include <pthread.h>
#include <sched.h>

namespace qz::detail {

/* The number of forks that led to this process, from the first call of count_forks. */
inline std::atomic<std::uint64_t> forks{0};

inline void count_forks() noexcept {
    static const int registered =
        pthread_atfork(nullptr, nullptr, [] { forks.fetch_add(1, std::memory_order_relaxed); });
    static_cast<void>(registered);
}

/*
 * A mutex that a thread of the parent may hold while another one forks. The child, which lacks the holder, makes
 * a new one when it first locks it.
 */
class fork_lock {
public:
    fork_lock() noexcept {
        count_forks();
        state_.store(ready(), std::memory_order_relaxed);
    }
    fork_lock(const fork_lock &) = delete;
    fork_lock &operator=(const fork_lock &) = delete;

    /* Returns whether the mutex is new, so that the protected data may be half changed. */
    bool lock() noexcept {
        const bool is_new = renew();
        mutex_.lock();
        return is_new;
    }
    void unlock() noexcept { mutex_.unlock(); }

private:
    [[nodiscard]] static std::uint64_t ready() noexcept { return 2 * forks.load(std::memory_order_relaxed); }

    /* One thread of the child makes the mutex while the others wait. After another fork this is repeated. */
    bool renew() noexcept {
        const std::uint64_t now = ready();
        for (std::uint64_t seen = state_.load(std::memory_order_acquire); seen != now;) {
            if (seen == now + 1) {
                sched_yield();
                seen = state_.load(std::memory_order_acquire);
            } else if (state_.compare_exchange_strong(seen, now + 1, std::memory_order_acquire)) {
                new (&mutex_) std::mutex;
                state_.store(now, std::memory_order_release);
                return true;
            }
        }
        return false;
    }

    std::mutex mutex_;
    std::atomic<std::uint64_t> state_; /* twice the forks when it was made; one more while it is being made */
};

} // namespace qz::detail

#endif
