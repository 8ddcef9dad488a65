// Signals that would end an edit and leave the editor's copy behind.
#include "noted_signals.h"

#include <iterator>

namespace qzacl {

namespace {

volatile std::sig_atomic_t came = 0;

void note(int) { came = 1; }

} // namespace

noted_signals::noted_signals() {
    struct sigaction noting = {};
    noting.sa_handler = note;
    for (std::size_t at = 0; at < std::size(signals); ++at) {
        sigaction(signals[at], nullptr, &before_[at]);
        if (before_[at].sa_handler != SIG_IGN)
            sigaction(signals[at], &noting, nullptr);
    }
}

noted_signals::~noted_signals() {
    for (std::size_t at = 0; at < std::size(signals); ++at)
        sigaction(signals[at], &before_[at], nullptr);
}

bool noted_signals::any() { return came != 0; }

} // namespace qzacl
