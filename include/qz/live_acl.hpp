/*
 * An ACL file that is reread when it changes: part of <qz/service.hpp>, which states the rules.
 */
#ifndef QZ_LIVE_ACL_HPP
#define QZ_LIVE_ACL_HPP

#include <qz/acl.hpp>
#include <qz/fork_lock.hpp>

#include <atomic>
#include <cstring>
#include <ctime>
#include <new>
#include <sys/stat.h>

namespace qz {

/* An ACL that its holders share, and that does not change. A null one holds none. */
class acl_snapshot {
public:
    acl_snapshot() noexcept = default;

    /* Takes the ACL over. Null when there is no memory. */
    explicit acl_snapshot(acl &&taken) noexcept : shared_(new (std::nothrow) shared{std::move(taken)}) {}

    acl_snapshot(const acl_snapshot &other) noexcept : shared_(other.shared_) {
        if (shared_ != nullptr)
            shared_->holders.fetch_add(1, std::memory_order_relaxed);
    }
    acl_snapshot(acl_snapshot &&other) noexcept : shared_(std::exchange(other.shared_, nullptr)) {}
    acl_snapshot &operator=(acl_snapshot other) noexcept {
        swap(other);
        return *this;
    }
    /* Writes each pointer once, so that a fork meanwhile leaves a whole one. */
    void swap(acl_snapshot &other) noexcept { std::swap(shared_, other.shared_); }
    ~acl_snapshot() {
        if (shared_ != nullptr && shared_->holders.fetch_sub(1, std::memory_order_acq_rel) == 1)
            delete shared_;
    }

    explicit operator bool() const noexcept { return shared_ != nullptr; }

    /* The ACL, of one that is not null. */
    [[nodiscard]] const acl &operator*() const noexcept { return shared_->value; }
    [[nodiscard]] const acl *operator->() const noexcept { return &shared_->value; }

private:
    struct shared {
        acl value;
        std::atomic<std::size_t> holders{1};
    };
    shared *shared_ = nullptr;
};

/* States that every program reads the file with the permissions of acl__default_perm_set. */
struct default_permissions_t {};
inline constexpr default_permissions_t default_permissions{};

namespace detail {

/* Distinguishes two states of a file. */
struct file_stamp {
    dev_t device = 0;
    ino_t number = 0;
    off_t size = 0;
    timespec modified = {};
    timespec changed = {};

    explicit file_stamp(const struct stat &status) noexcept
        : device(status.st_dev), number(status.st_ino), size(status.st_size), modified(status.st_mtim),
          changed(status.st_ctim) {}
    file_stamp() noexcept = default;

    [[nodiscard]] bool operator==(const file_stamp &other) const noexcept {
        const auto is_same = [](const timespec &a, const timespec &b) {
            return a.tv_sec == b.tv_sec && a.tv_nsec == b.tv_nsec;
        };
        return device == other.device && number == other.number && size == other.size &&
               is_same(modified, other.modified) && is_same(changed, other.changed);
    }

    /*
     * Whether every change from now on gives another stamp. The system takes the time of a change from its
     * coarse clock, which ticks at least every 10 ms; a time of whole seconds may come from a file system
     * that keeps no more, and those of some have two.
     */
    [[nodiscard]] bool is_settled(const timespec &now) const noexcept {
        constexpr long long second = 1000000000, tick = second / 50;
        const long long reach = changed.tv_nsec == 0 ? 2 * second : tick;
        const long long seconds = static_cast<long long>(now.tv_sec) - changed.tv_sec;
        if (seconds > 3 || seconds < -3)
            return true;
        const long long age = seconds * second + now.tv_nsec - changed.tv_nsec;
        return age > reach || age < -reach;
    }
};

} // namespace detail

/*
 * The current state of an ACL file: any number of threads take the snapshot and decide by it, while one or
 * several of them call refresh, which rereads the file when it has changed.
 *
 * Forks: the child can use the live_acl of its parent, even if other threads were using it at that moment; its
 * first refresh may then read the file once more. The fork must run the handlers of pthread_atfork, as fork()
 * does and vfork() does not.
 */
class live_acl {
public:
    /*
     * Follows a file, which the first refresh reads: always its text. A cache file does not record the set of
     * permissions that compiled it.
     *
     *   path   copied; a relative one is looked up from the working directory at each refresh
     *   set    the permissions of the text, not owned; null: acl__default_perm_set
     */
    explicit live_acl(const char *path, const sec_perm_set_t *set = nullptr) noexcept
        : live_acl(path, set, SEC_READ_ACL_TEXT) {}

    /* Follows a file that every program reads with the default permissions, so that its cache may be read. */
    live_acl(const char *path, default_permissions_t) noexcept
        : live_acl(path, nullptr, SEC_READ_ACL_CONVERT) {}

    live_acl(const live_acl &) = delete;
    live_acl &operator=(const live_acl &) = delete;

    /*
     * Reads the file if its device, number, size or one of its times differs from the last reading, or if it
     * changed so shortly before that reading that a further change might have the same times. The result becomes
     * the snapshot unless its bytes are the same. Clears the recorded error.
     *
     * The value says whether there is a new snapshot. After a failure the last good one stays, the recorded error
     * says what is wrong, and the next refresh tries again.
     *
     * Codes: those of sec_read_acl_file; 6.
     * Threads: shared; several at once wait for each other.
     */
    result<bool> refresh() noexcept {
        const held one_at_a_time(refreshing_);
        if (one_at_a_time.is_new())
            is_settled_ = false;
        const result<bool> outcome = refresh_alone();
        code_.store(outcome.code(), std::memory_order_relaxed);
        return outcome;
    }

    /* The last good reading; null before the first. Threads: shared. */
    [[nodiscard]] acl_snapshot snapshot() const noexcept {
        const held lock(exchanging_);
        return current_;
    }

    /* The code of the last refresh in any thread; 37 before the first. Threads: shared. */
    [[nodiscard]] int code() const noexcept { return code_.load(std::memory_order_relaxed); }

private:
    class held {
    public:
        explicit held(detail::fork_lock &lock) noexcept : lock_(lock), is_new_(lock.lock()) {}
        held(const held &) = delete;
        held &operator=(const held &) = delete;
        ~held() { lock_.unlock(); }
        [[nodiscard]] bool is_new() const noexcept { return is_new_; }

    private:
        detail::fork_lock &lock_;
        bool is_new_;
    };

    struct release {
        void operator()(char *path) const noexcept { std::free(path); }
    };

    live_acl(const char *path, const sec_perm_set_t *set, std::uint32_t flags) noexcept
        : path_(path != nullptr ? strdup(path) : nullptr), lacks_memory_(path != nullptr && !path_),
          set_(set), flags_(flags) {}

    result<bool> refresh_alone() noexcept {
        cu_set_no_error_1();
        if (lacks_memory_)
            return {SEC_S_NO_MEMORY, false};
        result<bool> outcome = refresh_once();
        /* A file that is replaced while it is being read is not a failure of the new file. */
        for (int left = 100; outcome.code() == SEC_S_FILE_ERROR && is_exchanged() && left != 0; --left)
            outcome = refresh_once();
        return outcome;
    }

    /* Takes the time and the stamp before reading, so that the next refresh notices a change during it. */
    result<bool> refresh_once() noexcept {
        timespec now = {};
        clock_gettime(CLOCK_REALTIME_COARSE, &now);
        const bool is_there = look(seen_);
        if (is_there && is_settled_ && seen_ == stamp_)
            return {SEC_S_OK, false};
        auto read = acl::read_file(path_.get(), nullptr, set_, flags_);
        if (!read)
            return {read.code(), false};
        const bool is_new = !current_ || current_->bytes() != read->bytes();
        if (is_new && !exchange(acl_snapshot(std::move(*read))))
            return {SEC_S_NO_MEMORY, false};
        stamp_ = seen_;
        is_settled_ = is_there && seen_.is_settled(now);
        return {SEC_S_OK, is_new};
    }

    bool look(detail::file_stamp &seen) const noexcept {
        struct stat status = {};
        const bool is_there = path_ && stat(path_.get(), &status) == 0;
        seen = is_there ? detail::file_stamp(status) : detail::file_stamp();
        return is_there;
    }

    [[nodiscard]] bool is_exchanged() const noexcept {
        detail::file_stamp now;
        return look(now) && !(now == seen_);
    }

    /* The old snapshot is released after the lock. */
    bool exchange(acl_snapshot made) noexcept {
        if (!made)
            return false;
        const held lock(exchanging_);
        current_.swap(made);
        return true;
    }

    const std::unique_ptr<char, release> path_;
    const bool lacks_memory_;
    const sec_perm_set_t *const set_;
    const std::uint32_t flags_;
    detail::fork_lock
        refreshing_;           /* held while the stamp is used, and while the current snapshot is exchanged */
    detail::file_stamp seen_;  /* before the last reading that was tried */
    detail::file_stamp stamp_; /* of the current snapshot */
    bool is_settled_ = false;
    mutable detail::fork_lock exchanging_; /* held while the current snapshot is copied or exchanged */
    acl_snapshot current_;
    std::atomic<int> code_{SEC_S_FILE_ERROR};
};

} // namespace qz

#endif
