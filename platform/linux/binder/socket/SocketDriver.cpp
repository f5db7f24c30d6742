#include "SocketDriver.h"

#include <android/log.h>
#include <pthread.h>
#include <signal.h>
#include <sys/random.h>

#include <cstring>
#include <new>
#include <utility>

#include "../Forked.h"
#include "SocketServiceManager.h"

namespace android {

std::unique_ptr<Driver> openSocketDriver(Driver::Process& process) {
    socket_driver::RuntimeDirectory directory;
    if (socket_driver::RuntimeDirectory::open(directory) != OK) return nullptr;
    auto driver = std::make_unique<socket_driver::SocketDriver>(process, std::move(directory));
    if (!driver->open()) return nullptr;
    return driver;
}

namespace socket_driver {
namespace {

constexpr char kTag[] = "BinderSocket";
constexpr std::chrono::milliseconds kQuiesceLimit{1000};

uint64_t randomNumber() {
    uint64_t number = 0;
    return getrandom(&number, sizeof number, 0) == sizeof number ? number : static_cast<uint64_t>(getpid());
}

}  // namespace

thread_local const SocketDriver::Serving* SocketDriver::serving_ = nullptr;
thread_local bool SocketDriver::keepsHouse_ = false;

// Stands for the pool's connections among the housekeeper's.
class SocketDriver::Sorter : public Endpoint {
public:
    explicit Sorter(SocketDriver& driver) : driver_(driver) {}
    int fd() const override { return driver_.pool_.fd(); }
    void onReady() override { driver_.sortArrivals(); }

private:
    SocketDriver& driver_;
};

SocketDriver::SocketDriver(Process& process, RuntimeDirectory directory)
    : process_(process),
      instance_(randomNumber()),
      errands_(std::make_shared<Errands>(threads_)),
      sorter_(std::make_shared<Sorter>(*this)),
      translator_(references_, *this),
      directory_(*this, std::move(directory)),
      serviceManager_(new SocketServiceManager(directory_)),
      chains_([this](Arrival arrival) { leaveToPool(std::move(arrival)); }) {}

bool SocketDriver::open() {
    watchForForks();
    return pool_.valid() && house_.valid() && errands_->valid() &&
           pool_.add(errands_, Poller::kReadable | Poller::kEdge) && house_.add(sorter_, Poller::kReadable);
}

status_t SocketDriver::requestDeathNotification(int32_t handle, const wp<BpBinder>& proxy) {
    return references_.mourn(handle, proxy);
}

// -- The pool

void SocketDriver::joinThreadPool(bool isMain) {
    // The program may end the thread while it runs a call, and it may have been the last.
    struct Leaving {
        SocketDriver& driver;
        ~Leaving() { driver.sortFromNowOn(); }
    };
    [[maybe_unused]] const Leaving leaving{*this};
    const ThreadBudget::Member member(threads_, !isMain);
    leaveArrivals();
    for (;;) {
        work();
        threads_.beginWait();
    }
}

// One errand, or whatever one connection has; counted as idle by the caller until there is something to do.
void SocketDriver::work() {
    Errand errand;
    if (errands_->take(errand, true)) {
        threads_.endWait();
        doErrand(std::move(errand));
        return;
    }
    const std::shared_ptr<Endpoint> endpoint = pool_.next();
    threads_.endWait();
    if (endpoint != nullptr) endpoint->tend();
}

void SocketDriver::doErrand(Errand errand) {
    const RunningCalls::Call running(running_);
    keepReader();
    const Errand own = std::move(errand);  // what it holds goes away while the call still counts
    try {
        own.run();
    } catch (const std::bad_alloc&) {
        // Who waits for what comes of it has been told by then.
    }
}

// On the platform a process without a pool learns of nothing. Here at least what it gave away comes back to
// it, when one of its threads is in the driver anyway: on a thread of the driver's own, objects would go away where
// the program expects nobody else to be at work.
void SocketDriver::doErrandsWithoutPool() {
    if (threads_.hasThreads() || serving_ != nullptr) return;
    for (Errand errand; errands_->take(errand, false);) doErrand(std::exchange(errand, Errand()));
}

void SocketDriver::quiesce() {
    if (!isForked()) running_.stop(kQuiesceLimit);
}

// A thread is about to run a program's code: somebody has to read what comes in meanwhile.
void SocketDriver::keepReader() {
    if (!threads_.hasThreads()) return;
    ThreadBudget::Next next = threads_.next();
    if (next == ThreadBudget::Next::kIsWanted && !process_.spawnPooledThread()) {
        threads_.notStarted();
        next = ThreadBudget::Next::kIsNot;
    }
    if (next == ThreadBudget::Next::kIsNot) sortFromNowOn();
}

// -- The housekeeper

bool SocketDriver::startHousekeeper() {
    const std::lock_guard<std::mutex> lock(houseMutex_);
    if (hasHousekeeper_) return true;
    pthread_attr_t attributes;
    if (pthread_attr_init(&attributes) != 0) return false;
    pthread_attr_setdetachstate(&attributes, PTHREAD_CREATE_DETACHED);
    // The program's signals are for the program's threads.
    sigset_t all, before;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &before);
    pthread_t thread;
    const auto keep = [](void* driver) -> void* {
        static_cast<SocketDriver*>(driver)->keepHouse();
        return nullptr;
    };
    const int error = pthread_create(&thread, &attributes, keep, this);
    pthread_sigmask(SIG_SETMASK, &before, nullptr);
    pthread_attr_destroy(&attributes);
    if (error != 0) __android_log_print(ANDROID_LOG_ERROR, kTag, "There is no thread to be had: %s", strerror(error));
    hasHousekeeper_ = error == 0;
    return hasHousekeeper_;
}

void SocketDriver::keepHouse() {
    pthread_setname_np(pthread_self(), "Binder_house");
    keepsHouse_ = true;
    for (;;) {
        if (const std::shared_ptr<Endpoint> endpoint = house_.next()) endpoint->tend();
    }
}

void SocketDriver::sortArrivals() {
    if (leaveArrivals()) return;
    if (const std::shared_ptr<Endpoint> endpoint = pool_.next(false)) endpoint->tend();
}

// False while no thread of the pool would see to them.
bool SocketDriver::leaveArrivals() {
    const std::lock_guard<std::mutex> lock(houseMutex_);
    if (threads_.idle() == 0) return false;
    sorts_ = false;
    house_.change(*sorter_, 0);
    return true;
}

void SocketDriver::sortFromNowOn() {
    const std::lock_guard<std::mutex> lock(houseMutex_);
    if (std::exchange(sorts_, true)) return;
    house_.change(*sorter_, Poller::kReadable);
}

}  // namespace socket_driver
}  // namespace android
