// A published name's socket.
#pragma once

#include <functional>

#include "Poller.h"

namespace android::socket_driver {

class Listener : public Endpoint {
public:
    Listener(UniqueFd socket, std::function<void(UniqueFd)> welcome);

    int fd() const override { return socket_.get(); }
    // Lets one in, so that nobody else is kept waiting by a crowd.
    void onReady() override;
    // Lets all in who are at the door, before it closes because the name is another's now.
    void finish();

private:
    bool letIn();
    void turnAway();

    const UniqueFd socket_;
    const std::function<void(UniqueFd)> welcome_;
    UniqueFd spare_;
};

}  // namespace android::socket_driver
