// The binder interface: the proxy, towards a service in another process, and the stub of one in this process.
#include <binder/IServiceManager.h>
#include <binder/Parcel.h>
#include <unistd.h>

#include "faults/driver.h"
#include "faults/plan.h"
#include "faults/row.h"
#include "ipc/ITavoBinder.h"
#include "ipc/TavoOsalService.h"
#include "tavo_osal/log.h"

namespace tavo::test::faults {
namespace {

using android::BpTavoBinder;
using android::IBinder;
using android::IMemoryHeap;
using android::ITavoBinder;
using android::Parcel;
using android::sp;
using android::String16;
using android::TavoOsalService;

constexpr int kKey = 7;
constexpr char kLocks[] = "libbinder's and the service's locks are of the default kind, which cannot fail";
constexpr char kUnanswered[] = "the service counts uses, not users: one whose answer was lost on the way stays counted";
constexpr char kHalfMade[] =
    "an object of libbinder's whose making fails half way leaves what libutils frees with the last reference only";

sp<IBinder> g_binder;
sp<ITavoBinder> g_proxy;
sp<IMemoryHeap> g_heap;
int g_result;

Expectation locks() { return skip({"pthread_mutex_lock", "pthread_mutex_unlock", "getsockopt"}, kLocks); }

void find_service() {
    g_binder = android::defaultServiceManager()->checkService(String16("android.tavo.osal"));
    g_proxy = new BpTavoBinder(g_binder);
}
void drop(long) {
    g_heap = nullptr;
    g_proxy = nullptr;
    g_binder = nullptr;
}
void find_service_with_queue() {
    find_service();
    g_proxy->create_message_queue(kKey);
}

// The result is what the reply yields; without one, it is 0, no heap and no descriptor.
std::vector<Outcome> outcomes(long empty) {
    std::vector<Outcome> all;
    for (const Outcome& outcome : {same(), fails(empty)}) {
        all.push_back(outcome);
        all.push_back(outcome.keeping_at_most(12, kHalfMade));
        all.push_back(outcome.keeping_at_most(12, kUnanswered).keeping_uses(kUnanswered));
    }
    return all;
}

// bad_alloc, which the C functions catch, is a result of its own here.
template <typename Call>
long result_of(Call call) {
    try {
        return call();
    } catch (const std::bad_alloc&) {
        return -12;
    }
}

Row proxy_row(const char* symbol, void (*prepare)(), long (*call)(), void (*undo)(long), long empty) {
    std::vector<Outcome> all = outcomes(empty);
    for (const Outcome& outcome : outcomes(-12)) {
        if (outcome.way == Outcome::kFails) all.push_back(outcome);
    }
    Scenario scenario = {"", prepare, call, undo, {on({}, all), locks()}};
    scenario.service = true;
    return {symbol, {scenario}};
}

std::vector<Row> proxy_rows() {
    const auto drop_queue = [](long) {
        g_proxy->delete_message_queue(kKey);
        drop(0);
    };
    const auto close_and_drop = [](long) {
        if (g_result >= 0) close(g_result);
        g_proxy->delete_message_queue(kKey);
        drop(0);
    };
    return {
        proxy_row(
            "android::BpTavoBinder::create_message_queue(int)", find_service,
            [] { return result_of([] { return long{g_proxy->create_message_queue(kKey)}; }); }, drop_queue, 0),
        proxy_row(
            "android::BpTavoBinder::delete_message_queue(int)", find_service_with_queue,
            [] { return result_of([] { return long{g_proxy->delete_message_queue(kKey)}; }); }, drop_queue, 0),
        proxy_row(
            "android::BpTavoBinder::get_fd(int)", find_service_with_queue,
            [] {
                g_result = -1;
                return result_of([] { return long{(g_result = g_proxy->get_fd(kKey)) >= 0}; });
            },
            close_and_drop, 0),
        proxy_row(
            "android::BpTavoBinder::get_write_fd(int)", find_service_with_queue,
            [] {
                g_result = -1;
                return result_of([] { return long{(g_result = g_proxy->get_write_fd(kKey)) >= 0}; });
            },
            close_and_drop, 0),
        proxy_row(
            "android::BpTavoBinder::get_shared_mem(int, int)", find_service,
            [] {
                return result_of([] {
                    g_heap = g_proxy->get_shared_mem(kKey, 100);
                    return long{g_heap != nullptr};
                });
            },
            [](long) {
                g_heap = nullptr;
                g_proxy->delete_shared_mem(kKey);
                drop(0);
            },
            0),
        proxy_row(
            "android::BpTavoBinder::delete_shared_mem(int)",
            [] {
                find_service();
                g_heap = g_proxy->get_shared_mem(kKey, 100);
                g_heap = nullptr;
            },
            [] { return result_of([] { return long{g_proxy->delete_shared_mem(kKey)}; }); },
            [](long) {
                g_proxy->delete_shared_mem(kKey);
                drop(0);
            },
            0),
        proxy_row(
            "android::BpTavoBinder::BpTavoBinder(android::sp<android::IBinder> const&)", find_service,
            [] {
                return result_of([] {
                    g_proxy = new BpTavoBinder(g_binder);
                    return 0L;
                });
            },
            drop, 0),
        proxy_row(
            "android::BpTavoBinder::~BpTavoBinder()", find_service,
            [] {
                drop(0);
                return 0L;
            },
            nullptr, 0),
        proxy_row(
            "android::ITavoBinder::asInterface(android::sp<android::IBinder> const&)", find_service,
            [] {
                return result_of([] {
                    g_proxy = ITavoBinder::asInterface(g_binder);
                    return long{g_proxy != nullptr};
                });
            },
            drop, 0),
        proxy_row(
            "android::ITavoBinder::getInterfaceDescriptor() const", find_service,
            [] { return static_cast<long>(g_proxy->ITavoBinder::getInterfaceDescriptor().size()); }, drop, 0),
    };
}

sp<TavoOsalService> g_service;

// Every operation's transaction, one after the other; a reply that could not be written is left short.
long transact_all() {
    long status = 0;
    for (uint32_t code = 3; code <= 8; ++code) {
        Parcel data, reply;
        data.writeInterfaceToken(ITavoBinder::descriptor);
        data.writeInt32(kKey);
        data.writeInt32(100);
        status += result_of([&] { return long{g_service->BnTavoBinder::onTransact(code, data, &reply, 0)}; });
    }
    return status;
}

std::vector<Row> stub_rows() {
    std::vector<Outcome> all;
    const Line no_pipe = {TAVO_LOG_INFO, "MSGQUEUE", "Error while openning pipe: *\n"};
    for (const Outcome& outcome : {same(), same_but({no_pipe}), fails(0), fails(0, {no_pipe}), fails(-12)}) {
        all.push_back(outcome.keeping_at_most(12, kUnanswered));
        all.push_back(outcome.keeping_mappings(1, "a mapping that the platform does not take back stays"));
    }
    return {{"android::BnTavoBinder::onTransact(unsigned int, android::Parcel const&, android::Parcel*, unsigned int)",
             {{"",
               [] {
                   g_service = new TavoOsalService;
                   g_service->TavoOsalServiceInit(2, 2);
               },
               transact_all,
               [](long) { g_service = nullptr; },
               {on({}, all), locks()}}}}};
}

}  // namespace

std::vector<Row> binder_rows() {
    std::vector<Row> rows = proxy_rows();
    for (Row& row : stub_rows()) rows.push_back(std::move(row));
    return rows;
}

}  // namespace tavo::test::faults
