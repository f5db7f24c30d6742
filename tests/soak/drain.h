// Takes what is left in a queue whose receiver was killed, and knows what that may have cost: the one message that the
// receiver had in hand. It may be gone as a whole, or without its length, or without its beginning.
#pragma once

#include "soak/board.h"
#include "soak/message.h"

namespace tavo::soak {

class Drain {
public:
    Drain() = default;
    // `loses_some`, to show that it is noticed.
    Drain(Channel& channel, unsigned number, int pipe, bool loses_some)
        : channel_(&channel), number_(number), pipe_(pipe), loses_some_(loses_some) {}

    // Whatever there is now.
    void take();
    // Nobody writes any more: what is left over has to be explained.
    void finish();
    // The allowance of one message that the killed receiver had in hand; true the first time.
    bool take_allowance();

private:
    void parse();
    bool find_first_frame();
    bool skip_to_frame(size_t at);
    // The message at an offset, as a whole; false when it has not all come.
    bool take_message(size_t at, size_t& end);
    void check(const Header& header, bool is_whole);
    Link* link_of_stream(uint32_t& number);
    Bytes next_of_stream(uint64_t behind);
    bool is_left_by_kills();
    bool is_part_of_next(size_t size, bool is_end);

    Channel* channel_ = nullptr;
    unsigned number_ = 0;
    int pipe_ = -1;
    bool loses_some_ = false;
    Bytes bytes_;
    bool is_in_step_ = false, is_lost_ = false, has_allowance_ = true;
};

}  // namespace tavo::soak
