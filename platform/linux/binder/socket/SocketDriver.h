// Binder between processes over Unix-domain sockets: no kernel module, no daemon. Wire.h says how they talk.
#pragma once

#include <memory>
#include <mutex>
#include <optional>

#include "../Driver.h"
#include "../RunningCalls.h"
#include "AsyncCalls.h"
#include "CallChains.h"
#include "Directory.h"
#include "Errands.h"
#include "Link.h"
#include "ObjectTranslator.h"
#include "Poller.h"
#include "References.h"
#include "ServedChannel.h"
#include "ThreadBudget.h"

namespace android {

// Null when the machine will not give what it takes.
std::unique_ptr<Driver> openSocketDriver(Driver::Process& process);

namespace socket_driver {

// Threads of the pool run programs' code. One more thread, the housekeeper, runs the driver's only and never waits for
// anybody: it looks after control connections, names and the directory, so that these work however busy a process
// is, and in one without a pool. While no thread of the pool waits for work, it also reads what comes in for them,
// takes oneway calls in, and hands calls that come back to the threads that wait for them.
//
// SocketDriver.cpp has the threads, SocketDriverLinks.cpp the acquaintance with other processes, SocketDriverCalls.cpp
// what goes out and SocketDriverService.cpp what comes in.
class SocketDriver final : public Driver,
                           private LinkEvents,
                           private TransactionServer,
                           private Introducer,
                           private Neighbourhood {
public:
    SocketDriver(Process& process, RuntimeDirectory directory);
    bool open();

    status_t transact(int32_t handle, uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) override;
    void acquire(int32_t handle) override { references_.acquire(handle); }
    void release(int32_t handle) override { references_.release(handle); }
    status_t requestDeathNotification(int32_t handle, const wp<BpBinder>& proxy) override;
    status_t clearDeathNotification(int32_t handle) override { return references_.forget(handle); }
    sp<IBinder> contextObject() override { return serviceManager_; }
    void setMaxThreads(size_t count) override { threads_.setMax(count); }
    void joinThreadPool(bool isMain) override;
    void quiesce() override;

private:
    // A transaction of this process's that a thread runs for somebody; nested ones know the outer.
    struct Serving {
        const Link* link;
        int channel;
        ServedChannel* served;  // null where the channel is one that this process calls on
        uint64_t chain;
        const Serving* outer;
        size_t depth = outer != nullptr ? outer->depth + 1 : 1;
    };
    enum class Outcome {
        kAnswered,
        kUnheard,  // the channel was closed before anything came
        kLost,     // the channel was closed, or the peer misbehaved
        kSilent,   // nothing came in the time there was
    };

    // LinkEvents
    bool channelOffered(const std::shared_ptr<Link>& link, Purpose purpose, UniqueFd channel) override;
    void referencesReleased(Link& link, uint64_t node, uint64_t count) override;
    void linkEnded(const std::shared_ptr<Link>& link) override;
    // TransactionServer
    bool transactionArrived(Arrival arrival) override;
    void channelClosed(ServedChannel& channel) override;
    // Introducer
    status_t introduce(const References::Route& route, UniqueFd& control) override;
    bool meet(UniqueFd control, sp<BBinder>& own, int32_t& handle) override;
    // Neighbourhood
    std::shared_ptr<Link> addLink(UniqueFd control, const Greeting* welcome) override;
    Greeting greeting(ControlType type) const override;
    status_t askDirectory(const std::shared_ptr<Link>& link, DirectoryCode code, const Parcel& data,
                          Parcel& reply) override;
    bool addListener(const std::shared_ptr<Endpoint>& listener) override;
    void removeListener(uint64_t listener) override { house_.remove(listener); }

    int32_t adoptDead();

    // Threads
    class Sorter;
    bool startHousekeeper();
    void keepHouse();
    void sortArrivals();
    bool leaveArrivals();
    void sortFromNowOn();
    void keepReader();
    void work();
    void doErrand(Errand errand);
    void doErrandsWithoutPool();

    // Calling
    status_t call(const References::Route& route, Purpose purpose, uint32_t code, const Parcel& data, Parcel* reply,
                  uint32_t flags);
    status_t callOnChannel(const std::shared_ptr<Link>& link, Purpose purpose, OutgoingParcel& out, Parcel* reply);
    Outcome exchange(const std::shared_ptr<Link>& link, int channel, Purpose purpose, OutgoingParcel& out,
                     Parcel* reply, status_t& status);
    FrameReader::Result await(int channel, FrameReader& reader, std::optional<CallChains::Waiting>& waiting,
                              Frame& frame);
    status_t takeReply(const std::shared_ptr<Link>& link, int channel, Frame& frame, Parcel* reply);
    static const Serving* servingFor(const Link& link);
    uint64_t chain() const;

    // Serving
    bool serveBack(const std::shared_ptr<Link>& link, int channel, Frame& frame, UsedHandles& handles);
    void serveArrival(Arrival& arrival);
    void leaveToPool(Arrival arrival);
    bool serve(const std::shared_ptr<Link>& link, const Caller& caller, Frame& frame, const Serving& serving,
               Parcel& data, Parcel& reply, status_t& status);
    status_t run(const sp<BBinder>& target, const Caller& caller, const FrameHeader& header, const Parcel& data,
                 Parcel& reply, const Serving* serving);
    bool acceptOneway(Arrival& arrival);
    void runOneway(const BBinder* target);
    bool serveDirectory(Arrival& arrival);
    bool serveLookUp(Arrival& arrival, const std::string& name);
    status_t makeIntroduction(Link& link, uint64_t node, Parcel& reply);
    template <typename Send>
    bool answer(Link& link, status_t status, const Parcel& reply, Send send);
    void answer(ServedChannel& channel, status_t status, const Parcel& reply);

    static thread_local const Serving* serving_;
    static thread_local bool keepsHouse_;

    Process& process_;
    const uint64_t instance_;
    Poller pool_;   // what the pool's threads wait for
    Poller house_;  // what the housekeeper does
    ThreadBudget threads_;
    const std::shared_ptr<Errands> errands_;
    const std::shared_ptr<Sorter> sorter_;
    References references_;
    ObjectTranslator translator_;
    Directory directory_;
    const sp<IBinder> serviceManager_;
    RunningCalls running_;
    CallChains chains_;
    AsyncCalls asyncCalls_;

    std::mutex houseMutex_;
    bool hasHousekeeper_ = false;
    bool sorts_ = true;
};

}  // namespace socket_driver
}  // namespace android
