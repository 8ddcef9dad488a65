// Signals that would end an edit and leave the editor's copy behind.
#ifndef QZACL_NOTED_SIGNALS_H
#define QZACL_NOTED_SIGNALS_H

#include <csignal>

namespace qzacl {

// Within its scope SIGHUP, SIGINT and SIGTERM are noted and end what the command waits for, unless they were ignored.
class noted_signals {
public:
    noted_signals();
    noted_signals(const noted_signals &) = delete;
    noted_signals &operator=(const noted_signals &) = delete;
    ~noted_signals();

    // Whether one came.
    static bool any();

private:
    static constexpr int signals[] = {SIGHUP, SIGINT, SIGTERM};

    struct sigaction before_[3] = {};
};

} // namespace qzacl

#endif
