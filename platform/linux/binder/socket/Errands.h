// Work for the threads of the pool that does not come from a connection of its own.
#pragma once

#include <atomic>
#include <deque>
#include <functional>
#include <mutex>

#include "Link.h"
#include "Poller.h"
#include "ThreadBudget.h"

namespace android::socket_driver {

struct Errand {
    std::function<void()> run;
    // Any thread that is in the driver anyway may do it where there is no pool.
    bool forAnyThread = false;
    // Who wants it done.
    const Link* link = nullptr;
};

// A thread that has time takes an errand before it waits for connections; one that waits already is woken.
class Errands : public Endpoint {
public:
    explicit Errands(ThreadBudget& threads);
    bool valid() const { return bell_.valid(); }

    void push(Errand errand);
    // Whoever wanted it is gone.
    void drop(const Link& link);
    // False when there is none.
    bool take(Errand& errand, bool isPoolThread);
    bool empty() const { return count_ == 0; }

    int fd() const override { return bell_.get(); }
    void onReady() override;

private:
    void ring();

    ThreadBudget& threads_;
    const UniqueFd bell_;
    std::atomic<size_t> count_{0};
    std::mutex mutex_;
    std::deque<Errand> errands_;
};

}  // namespace android::socket_driver
