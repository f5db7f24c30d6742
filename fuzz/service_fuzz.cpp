// Sends transactions of any contents to the service, through its stub, and compares the answers with a model.
//
// The input is a script of transactions: code, kind of token, objects, and either a key and a size or any bytes.
#include <binder/IMemory.h>
#include <binder/Parcel.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <map>
#include <vector>

#include "fuzz/received_parcel.h"
#include "fuzz/script.h"
#include "ipc/TavoOsalService.h"
#include "tavo_osal/log.h"

namespace {

using namespace android;
using tavo::fuzz::require;
using tavo::fuzz::Script;

enum : uint32_t { kGetBlock = 3, kDeleteBlock, kCreateQueue, kDeleteQueue, kGetWriteFd, kGetFd };

// What the service is to answer, by its rules told once more.
class Model {
public:
    // The place of the queue, where it is new as well.
    int create_queue(int key) {
        if (key == 0) return -1;
        const auto queue = find(key);
        if (queue == queues_.end()) {
            queues_.push_back({key, 1});
            return static_cast<int>(queues_.size()) - 1;
        }
        ++queue->uses;
        return static_cast<int>(queue - queues_.begin());
    }
    int delete_queue(int key) {
        const auto queue = find(key);
        if (queue == queues_.end()) return -1;
        if (--queue->uses == 0) queues_.erase(queue);
        return 0;
    }
    bool has_queue(int key) { return find(key) != queues_.end(); }

    // What a block with this key has to be: whatever it is, if it is new.
    void get_block(int key, int size, const sp<IMemoryHeap>& heap) {
        if (key == 0 || size < 1) return require(heap == nullptr, "no block for a bad key or size");
        require(heap != nullptr, "a block for a good key and size");
        Block& block = blocks_[key];
        if (block.uses++ == 0) block.heap = heap;
        require(block.heap == heap, "one block for one key");
    }
    int delete_block(int key) {
        if (key <= 0) return TAVO_FAILURE;
        const auto block = blocks_.find(key);
        if (block != blocks_.end() && --block->second.uses == 0) blocks_.erase(block);
        return 0;
    }
    bool has_block(int key) const { return blocks_.count(key) != 0; }

    // Gives back everything that can be given back, and counts along.
    void clear(TavoOsalService& service) {
        while (!queues_.empty()) {
            const int key = queues_.back().key;
            require(service.delete_message_queue(key) == delete_queue(key), "every use of a queue is given back");
            require(has_queue(key) || service.get_fd(key) == -1, "a queue goes with its last use");
        }
        for (auto block = blocks_.upper_bound(0); block != blocks_.end(); block = blocks_.upper_bound(0)) {
            const int key = block->first;
            require(service.delete_shared_mem(key) == delete_block(key), "every use of a block is given back");
        }
    }

private:
    struct Queue {
        int key;
        unsigned uses;
    };
    struct Block {
        sp<IMemoryHeap> heap;
        unsigned uses = 0;
    };
    std::vector<Queue>::iterator find(int key) {
        return std::find_if(queues_.begin(), queues_.end(), [=](const Queue& queue) { return queue.key == key; });
    }

    std::vector<Queue> queues_;
    std::map<int, Block> blocks_;
};

struct Transaction {
    uint32_t code;
    Parcel data;
};

void write_token(std::vector<uint8_t>& bytes, const String16& name) {
    Parcel parcel;
    parcel.writeInterfaceToken(name);
    bytes.insert(bytes.end(), parcel.data(), parcel.data() + parcel.dataSize());
}

template <typename T>
void append(std::vector<uint8_t>& bytes, T value) {
    const auto* start = reinterpret_cast<const uint8_t*>(&value);
    bytes.insert(bytes.end(), start, start + sizeof value);
}

// A few keys, so that transactions meet; and any other.
int take_key(Script& script) {
    const auto choice = script.take<uint8_t>();
    return choice < 240 ? choice % 8 : script.take<int32_t>();
}

void take_transaction(Script& script, const sp<BBinder>& service, Transaction& transaction) {
    constexpr uint32_t kPlatform[] = {IBinder::PING_TRANSACTION, IBinder::DUMP_TRANSACTION,
                                      IBinder::INTERFACE_TRANSACTION, 0};
    const auto code = script.take<uint8_t>();
    transaction.code = code < 240 ? code % 12 : kPlatform[code % 4];
    const auto kind = script.take<uint8_t>();
    std::vector<uint8_t> bytes;
    if (kind % 8 < 6) write_token(bytes, ITavoBinder::descriptor);
    if (kind % 8 == 6) write_token(bytes, String16("android.tavo.osal"));
    std::vector<tavo::fuzz::ObjectPlan> objects;
    if (kind & 0x10) objects = tavo::fuzz::take_objects(script);
    if (kind & 0x20) {
        const auto any = script.take_bytes(script.take<uint8_t>());
        bytes.insert(bytes.end(), any.begin(), any.end());
    } else {
        append(bytes, take_key(script));
        append(bytes, script.take<int32_t>());
    }
    tavo::fuzz::receive(transaction.data, bytes, objects, service);
}

// A block with a negative key is there for ever, as its users expect: only few of them can be tried in one process.
bool stays_for_ever(uint32_t code, int key) { return code == kGetBlock && key < -4; }

void run(const sp<TavoOsalService>& service, Model& model, Script& script) {
    Transaction transaction;
    take_transaction(script, service, transaction);
    const Parcel& data = transaction.data;
    const bool is_known = transaction.code >= kGetBlock && transaction.code <= kGetFd;
    const bool is_admitted = is_known && data.checkInterface(service.get());
    const int key = data.readInt32();
    const int size = data.readInt32();
    data.setDataPosition(0);
    if (is_admitted && stays_for_ever(transaction.code, key)) return;

    Parcel reply;
    const status_t status = service->transact(transaction.code, data, &reply, 0);
    reply.setDataPosition(0);
    if (!is_known) return;
    if (!is_admitted) return require(status == PERMISSION_DENIED && reply.dataSize() == 0, "strangers are refused");
    require(status == NO_ERROR, "a known code is answered");
    switch (transaction.code) {
        case kGetBlock: model.get_block(key, size, IMemoryHeap::asInterface(reply.readStrongBinder())); break;
        case kDeleteBlock: require(reply.readInt32() == model.delete_block(key), "a block's delete"); break;
        case kCreateQueue: require(reply.readInt32() == model.create_queue(key), "a queue's create"); break;
        case kDeleteQueue: require(reply.readInt32() == model.delete_queue(key), "a queue's delete"); break;
        default:
            const int end = transaction.code == kGetFd ? service->get_fd(key) : service->get_write_fd(key);
            require((end > 0) == model.has_queue(key), "a queue that is there has both ends");
            require(reply.readFileDescriptor() == end, "a queue's end");
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    // Handles lead to no proxies, because there is no driver: everything stays in this process.
    static const bool no_driver = setenv("BINDER_DRIVER", "none", 1) == 0;
    static_cast<void>(no_driver);
    g_uiMxEnabledLogLevel = TAVO_LOG_TRACE;
    // One service for all inputs, like the one for all clients. What an input leaves is given back behind it.
    static const sp<TavoOsalService>& service = *new sp<TavoOsalService>(new TavoOsalService);
    static const int status = service->TavoOsalServiceInit(2, 2);
    static Model& model = *new Model;
    require(status == TAVO_SUCCESS, "the service has tables");

    Script script(data, size);
    for (int count = 0; count < 64 && !script.ended(); ++count) run(service, model, script);
    model.clear(*service);
    return 0;
}
