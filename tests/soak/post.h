// A client's end of the queues that all clients share: what it sends, and the threads that receive.
#pragma once

#include <pthread.h>

#include <array>
#include <memory>

#include "soak/client.h"
#include "soak/message.h"
#include "tavo_osal/status.h"

namespace tavo::soak {

// Attached to a channel under the key it has now, and written down on the board while it is.
class Attachment {
public:
    // `place` is this client's on the board.
    Attachment(Channel& channel, std::atomic<uint32_t>& place) : channel_(channel), place_(place) {}
    // False when the channel is not open, or this fails, which is told.
    bool attach(unsigned way);
    void detach();
    bool is_attached() const { return handle_ > 0; }
    // What it is attached to is being given up.
    bool must_leave() const { return channel_.state != ChannelState::kOpen || channel_.serial != serial_; }

    TAVO_INT64 handle() const { return handle_; }
    uint32_t serial() const { return serial_; }

private:
    Channel& channel_;
    std::atomic<uint32_t>& place_;
    TAVO_INT64 handle_ = 0;
    uint32_t serial_ = 0;
};

class Sender {
public:
    Sender(Client& client, unsigned channel);
    // Attached and with a link; false when there is nothing to send to.
    bool is_ready();
    void send_letter();
    bool send_bye();
    void detach() { attachment_.detach(); }
    void leave_if_told();

private:
    bool find_link();
    bool put(const Header& header, const Bytes& message);
    Header next_header();

    Client& client_;
    const unsigned number_;
    Channel& channel_;
    Attachment attachment_;
    Link* link_ = nullptr;
    uint32_t link_number_ = 0;
    uint32_t link_serial_ = 0;  // the channel's that the link is for
};

// A thread that receives from one channel, whichever queue that is at a time.
class Receiver {
public:
    Receiver(Client& client, unsigned channel);
    bool start();
    void join();

private:
    static void* run(void* self);
    void serve();
    // False when the queue is to be left.
    bool receive();
    bool take(const Header& header);
    bool take_torn(size_t size);
    void end_links_before(unsigned slot, const Link& link);

    Board& board_;
    Slot& slot_;
    const unsigned number_;
    Channel& channel_;
    Attachment attachment_;
    Random random_;
    Bytes buffer_;
    uint32_t served_ = 0;  // the latest serial
    pthread_t thread_ = {};
};

class Post {
public:
    bool start(Client& client);
    // Before every operation: nobody else may wait for this client to leave.
    void leave_where_told();
    void send_letters(Client& client);
    void send_stream(Client& client);
    void leave_one(Client& client);
    // Says goodbye, awaits the others' and leaves everything.
    void end(Client& client);

private:
    std::array<std::unique_ptr<Sender>, kInboxes> letters_;
    std::unique_ptr<Sender> stream_;
    std::unique_ptr<Receiver> inbox_, incoming_;
};

}  // namespace tavo::soak
