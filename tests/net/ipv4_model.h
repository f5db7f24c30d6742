// The rules for IPv4 texts once more, written without the scanner that the library uses: a cursor that walks over
// the text by hand. What the library answers is compared with this.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "tavo_osal/status.h"

namespace tavo::test {

struct Ipv4Verdict {
    struct Message {
        unsigned level;
        std::string text;
    };
    TAVO_Status status;
    std::vector<Message> messages;
};

class Ipv4Model {
public:
    // The verdict on a text, without its terminator.
    static Ipv4Verdict judge(std::string_view text) {
        const std::string copy(text);
        const auto refuse = [&](const std::string& reason) { return Ipv4Verdict{TAVO_FAILURE, {{1, reason + "\n"}}}; };
        if (text == "0.0.0.0") return refuse("A non-routable meta-address designating invalid target:" + copy);
        if (text.size() < 7 || text.size() > 15) {
            return refuse("Invalid length of IP address(Correct range 7-15 including dots):" + copy);
        }
        Ipv4Model model(text);
        if (!model.four_numbers_and_no_more()) {
            return refuse("Invalid IPv4 address, more or less than 4 segments:" + copy);
        }
        const long* numbers = model.numbers_;
        for (int i = 0; i < 4; ++i) {
            // What is negative counts as a huge number, and is shown as it was written.
            if (numbers[i] < 0 || numbers[i] > 255) {
                return refuse("Invalid range within IP:" + copy + ", error segment:" + std::to_string(numbers[i]));
            }
        }
        Ipv4Verdict verdict = {TAVO_SUCCESS, {}};
        const bool same_host_octets = numbers[0] > 0 && numbers[1] == numbers[2] && numbers[2] == numbers[3];
        if (same_host_octets && numbers[1] == 0) {
            verdict.messages.push_back(
                {2, "Encountered a Network address(host id  portion bits of an IP address are zero):" + copy + "\n"});
        }
        if (same_host_octets && numbers[1] == 255) {
            verdict.messages.push_back(
                {2, "Encountered a Broadcast address(host id portion bits of an IP address are one):" + copy + "\n"});
        }
        return verdict;
    }

private:
    explicit Ipv4Model(std::string_view text) : rest_(text) {}

    bool four_numbers_and_no_more() {
        for (int i = 0; i < 4; ++i) {
            if (i > 0 && !take('.')) return false;
            if (!take_number(numbers_[i])) return false;
        }
        skip_blanks();
        return rest_.empty();
    }

    static bool blank(char c) { return c == ' ' || (c >= '\t' && c <= '\r'); }
    static bool digit(char c) { return c >= '0' && c <= '9'; }

    void skip_blanks() {
        while (!rest_.empty() && blank(rest_.front())) rest_.remove_prefix(1);
    }

    bool take(char wanted) {
        if (rest_.empty() || rest_.front() != wanted) return false;
        rest_.remove_prefix(1);
        return true;
    }

    // Blanks, then at most three characters: a sign, if any, and digits, at least one.
    bool take_number(long& number) {
        skip_blanks();
        size_t room = 3;
        bool negative = false;
        if (!rest_.empty() && (rest_.front() == '+' || rest_.front() == '-')) {
            negative = rest_.front() == '-';
            rest_.remove_prefix(1);
            --room;
        }
        size_t digits = 0;
        number = 0;
        for (; digits < room && !rest_.empty() && digit(rest_.front()); ++digits) {
            number = number * 10 + (rest_.front() - '0');
            rest_.remove_prefix(1);
        }
        if (negative) number = -number;
        return digits > 0;
    }

    std::string_view rest_;
    long numbers_[4] = {};
};

}  // namespace tavo::test
