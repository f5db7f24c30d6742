#include "Errands.h"

#include <sys/eventfd.h>

#include <algorithm>
#include <iterator>
#include <utility>

namespace android::socket_driver {

Errands::Errands(ThreadBudget& threads) : threads_(threads), bell_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

void Errands::push(Errand errand) {
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        errands_.push_back(std::move(errand));
        ++count_;
    }
    ring();
}

void Errands::drop(const Link& link) {
    std::deque<Errand> dropped;  // declared first: goes away without the lock
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto first = std::stable_partition(errands_.begin(), errands_.end(),
                                             [&link](const Errand& errand) { return errand.link != &link; });
    std::move(first, errands_.end(), std::back_inserter(dropped));
    errands_.erase(first, errands_.end());
    count_ -= dropped.size();
}

bool Errands::take(Errand& errand, bool isPoolThread) {
    if (empty()) return false;
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        const auto found = std::find_if(errands_.begin(), errands_.end(), [isPoolThread](const Errand& candidate) {
            return isPoolThread || candidate.forAnyThread;
        });
        if (found == errands_.end()) return false;
        errand = std::move(*found);
        errands_.erase(found);
        --count_;
    }
    if (isPoolThread && !empty()) ring();
    return true;
}

// A thread counts as idle before it looks for errands for the last time, so one that is not yet needs no bell.
void Errands::ring() {
    if (threads_.idle() > 0) eventfd_write(bell_.get(), 1);
}

void Errands::onReady() {
    eventfd_t rings = 0;
    eventfd_read(bell_.get(), &rings);
    // Whoever heard the bell looks for errands next. One who keeps house does not do any, so another must hear it.
    if (!empty()) ring();
}

}  // namespace android::socket_driver
