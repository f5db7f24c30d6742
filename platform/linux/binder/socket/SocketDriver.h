// Binder between processes over Unix-domain sockets: no kernel module, no daemon. Wire.h says how they talk.
#pragma once

#include <memory>
#include <vector>

#include "../Driver.h"
#include "AsyncCalls.h"
#include "Directory.h"
#include "Link.h"
#include "ObjectTranslator.h"
#include "Poller.h"
#include "References.h"
#include "RunningCalls.h"
#include "ServedChannel.h"
#include "ThreadBudget.h"

namespace android {

// Null when the machine will not give what it takes.
std::unique_ptr<Driver> openSocketDriver(Driver::Process& process);

namespace socket_driver {

class SocketDriver final : public Driver,
                           private LinkEvents,
                           private TransactionServer,
                           private Introducer,
                           private Neighbourhood {
public:
    SocketDriver(Process& process, RuntimeDirectory directory);
    bool valid() const { return poller_.valid(); }

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
        const Serving* outer;
    };

    // LinkEvents
    void channelOffered(const std::shared_ptr<Link>& link, UniqueFd channel) override;
    void referencesReleased(Link& link, uint64_t node, uint64_t count) override;
    void linkEnded(const std::shared_ptr<Link>& link) override;
    // TransactionServer
    void transactionArrived(ServedChannel& channel, Frame& frame) override;
    void channelClosed(ServedChannel& channel) override;
    void peerMisbehaved(ServedChannel& channel) override;
    // Introducer
    status_t introduce(const References::Route& route, UniqueFd& control) override;
    std::shared_ptr<Link> meet(UniqueFd control) override;
    // Neighbourhood
    std::shared_ptr<Link> addLink(UniqueFd control, Caller peer, uint64_t instance) override;
    status_t call(const std::shared_ptr<Link>& link, uint64_t node, uint32_t code, const Parcel& data, Parcel* reply,
                  uint32_t flags) override;
    Poller& poller() override { return poller_; }

    // Calling
    status_t exchange(const std::shared_ptr<Link>& link, int channel, OutgoingParcel& out, Parcel* reply,
                      bool& reusable);
    status_t takeReply(Frame& frame, const std::shared_ptr<Link>& link, Parcel* reply);
    status_t lose(const std::shared_ptr<Link>& link);
    static int channelBackTo(const Link& link);

    // Serving
    status_t serve(const std::shared_ptr<Link>& link, const Caller& caller, int channel, Frame& frame, Parcel& reply);
    status_t serveDirectory(Link& link, uint32_t code, const Parcel& data, Parcel& reply);
    status_t makeIntroduction(Link& link, uint64_t node, Parcel& reply);
    template <typename Send>
    bool answer(Link& link, status_t status, const Parcel& reply, Send send);
    status_t run(const AsyncCall& call, const Parcel& data, Parcel& reply, const Serving* serving);
    void keepSpareThread();

    static thread_local const Serving* serving_;
    // Objects whose oneway calls this thread is to run once it has let go of the channel.
    static thread_local std::vector<const BBinder*> queued_;

    Process& process_;
    Poller poller_;
    References references_;
    ObjectTranslator translator_;
    Directory directory_;
    sp<IBinder> serviceManager_;
    ThreadBudget threads_;
    RunningCalls running_;
    AsyncCalls asyncCalls_;
};

}  // namespace socket_driver
}  // namespace android
