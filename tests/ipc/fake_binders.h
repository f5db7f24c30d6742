// Both ends of the binder interface with nothing behind them.
#pragma once

#include <binder/Parcel.h>

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "ipc/ITavoBinder.h"

namespace tavo::test {

// An object that is no ITavoBinder, so that a proxy is made for it. Notes what the proxy sends and answers as it is
// told.
class FakeRemote : public android::BBinder {
public:
    struct Request {
        uint32_t code;
        uint32_t flags;
        std::vector<uint8_t> bytes;
        size_t objects;
    };

    android::status_t transact(uint32_t code, const android::Parcel& data, android::Parcel* reply,
                               uint32_t flags) override {
        requests.push_back({code, flags, {data.data(), data.data() + data.dataSize()}, data.objectsCount()});
        const android::status_t status = answer ? answer(reply) : android::NO_ERROR;
        reply->setDataPosition(0);
        return status;
    }

    std::vector<Request> requests;
    std::function<android::status_t(android::Parcel* reply)> answer;  // none: an empty reply
};

// A service that notes how it is called and answers as it is told.
class FakeService : public android::BnTavoBinder {
public:
    int get_fd(int key) override { return note("get_fd", key); }
    int get_write_fd(int key) override { return note("get_write_fd", key); }
    int create_message_queue(int key) override { return note("create_message_queue", key); }
    int delete_message_queue(int key) override { return note("delete_message_queue", key); }
    android::sp<android::IMemoryHeap> get_shared_mem(int key, int size) override {
        note("get_shared_mem", key);
        calls.back() += " " + std::to_string(size);
        return heap;
    }
    int delete_shared_mem(int key) override { return note("delete_shared_mem", key); }

    std::vector<std::string> calls;
    int result = 0;
    android::sp<android::IMemoryHeap> heap;

private:
    int note(const std::string& operation, int key) {
        calls.push_back(operation + " " + std::to_string(key));
        return result;
    }
};

}  // namespace tavo::test
