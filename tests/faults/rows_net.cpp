// Sockets and network interfaces.
#include <arpa/inet.h>
#include <fcntl.h>
#include <linux/netlink.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>

#include "faults/plan.h"
#include "faults/row.h"
#include "tavo_osal/log.h"
#include "tavo_osal/network.h"
#include "tavo_osal/socket.h"

namespace tavo::test::faults {
namespace {

constexpr char kHost[] = "127.0.0.1";
constexpr char kPath[] = "/sdcard/socket";

Line error(std::string text) { return {TAVO_LOG_ERROR, "OSAL_SOCKET", std::move(text)}; }

int g_socket = -1;
int g_peer = -1;
int g_made = -1;
unsigned g_port;
char g_byte[1];

void close_all(long) {
    for (int* each : {&g_socket, &g_peer, &g_made}) {
        if (*each > 0) close(*each);
        *each = -1;
    }
}

void make_pair() {
    int ends[2];
    socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends);
    g_socket = ends[0];
    g_peer = ends[1];
}
void make_pair_with_a_byte() {
    make_pair();
    if (write(g_peer, "x", 1) != 1) abort();
}

unsigned port_of(int descriptor) {
    sockaddr_in address = {};
    socklen_t length = sizeof address;
    getsockname(descriptor, reinterpret_cast<sockaddr*>(&address), &length);
    return ntohs(address.sin_port);
}

void bind_to_loopback(int descriptor) {
    sockaddr_in address = {};
    address.sin_family = AF_INET;
    inet_aton(kHost, &address.sin_addr);
    bind(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof address);
}

void make_stream() { g_socket = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0); }
void make_listener() {
    g_peer = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    bind_to_loopback(g_peer);
    listen(g_peer, 4);
    g_port = port_of(g_peer);
    make_stream();
}
void make_connecting() {
    make_listener();
    sockaddr_in address = {};
    socklen_t length = sizeof address;
    getsockname(g_peer, reinterpret_cast<sockaddr*>(&address), &length);
    if (connect(g_socket, reinterpret_cast<const sockaddr*>(&address), length) != 0) abort();
}
void make_datagrams() {
    g_peer = socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    bind_to_loopback(g_peer);
    g_port = port_of(g_peer);
    g_socket = socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0);
}
void make_datagrams_with_one() {
    make_datagrams();
    tavo_osal_socket_sendto(g_socket, kHost, g_port, "x", 1, 0);
}

Expectation resolver() {
    return on({"gethostbyname"}, {fails(TAVO_INVALID_PARAM, {error("Get host by name failed. Errno: 1.\n")})});
}

// The rows of functions that do one thing to a stream's socket.
Row on_stream(const char* symbol, long (*call)(), std::vector<Expectation> expectations) {
    return {symbol, {{"", make_stream, call, close_all, std::move(expectations)}}};
}
Expectation option(const char* text) { return on({"setsockopt"}, {fails(TAVO_SOCKET_OPTION_FAILED, {error(text)})}); }

std::vector<Row> life_rows() {
    return {
        {"tavo_osal_socket_create",
         {{"",
           nullptr,
           [] { return long{tavo_osal_socket_create(AF_INET, SOCK_STREAM, 0, &g_socket)}; },
           [](long result) {
               expect((result == 0) == (g_socket > 0), "the descriptor is -1 on a failure");
               close_all(0);
           },
           {on({"socket"}, {fails(TAVO_SOCKET_CREATE_FAILED, {error("Socket Create Failed. Errno: 24.\n")})})}}}},
        {"tavo_osal_socket_connect",
         {{"",
           make_listener,
           [] { return long{tavo_osal_socket_connect(g_socket, kHost, g_port)}; },
           close_all,
           {resolver(),
            on({"connect"}, {fails(TAVO_SOCKET_CONNECT_FAILED, {error("Socket connect failed. Errno: 111.\n")})})}}}},
        on_stream("tavo_osal_socket_bind", [] { return long{tavo_osal_socket_bind(g_socket, kHost, 0)}; },
                  {resolver(), on({"bind"}, {fails(TAVO_SOCKET_CONNECT_FAILED,
                                                   {error("Socket connect call failed. Errno: 98.\n")})})}),
        {"tavo_osal_nl_socket_bind",
         {{"",
           [] { g_socket = socket(AF_NETLINK, SOCK_RAW | SOCK_CLOEXEC, NETLINK_KOBJECT_UEVENT); },
           [] { return long{tavo_osal_nl_socket_bind(g_socket)}; },
           close_all,
           {on({"bind"}, {fails(TAVO_SOCKET_CONNECT_FAILED, {error("NL Socket bind call failed. Errno: 98.\n")})})}}}},
        {"tavo_osal_socket_listen",
         {{"",
           [] {
               make_stream();
               bind_to_loopback(g_socket);
           },
           [] { return long{tavo_osal_socket_listen(g_socket, 1)}; },
           close_all,
           {on({"listen"}, {fails(TAVO_FAILURE, {error("Socket listen call failed. errno = 98\n")})})}}}},
        {"tavo_osal_socket_accept",
         {{"",
           make_connecting,
           [] {
               const int result = tavo_osal_socket_accept(g_peer, nullptr, nullptr);
               g_made = result < TAVO_FAILURE ? result : -1;
               return g_made > 0 ? 0 : long{result};
           },
           close_all,
           {on({"accept4"},
               {fails(TAVO_SOCKET_CONNECT_FAILED, {error("Error in accepting connection error= 24\n")})})}}}},
        {"tavo_osal_socket_shutdown",
         {{"",
           make_pair,
           [] { return long{tavo_osal_socket_shutdown(g_socket)}; },
           close_all,
           {on({"shutdown"}, {fails(TAVO_SOCKET_CLOSE_FAILED, {error("Socket shutdown Failed. Errno: 0X6B.\n")})})}}}},
        {"tavo_osal_socket_close",
         {{"",
           make_pair,
           [] { return long{tavo_osal_socket_close(g_socket)}; },
           [](long) {
               g_socket = -1;
               close_all(0);
           },
           {on({"close"},
               {fails(TAVO_SOCKET_CLOSE_FAILED, {error("Socket Close Failed. iSocketFd= *, Errno: 5.\n")})})}}}},
        {"tavo_osal_unix_domain_socket_bind",
         {{"",
           [] { g_socket = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0); },
           [] { return long{tavo_osal_unix_domain_socket_bind(g_socket, kPath)}; },
           [](long) {
               close_all(0);
               remove(kPath);
           },
           // That nothing could be removed is the way on.
           {on({"unlink"}, {same()}),
            on({"bind"}, {fails(TAVO_FAILURE, {error("Error while binding to socket. iSocketFd=*, errno=98\n")})})}}}},
    };
}

std::vector<Row> option_rows() {
    return {
        on_stream("tavo_osal_socket_setoption",
                  [] { return long{tavo_osal_socket_setoption(g_socket, SO_REUSEADDR, 1)}; },
                  {on({"setsockopt"}, {fails(TAVO_FAILURE, {error("Set socket option failed. errno=92\n")})})}),
        on_stream("tavo_osal_socket_set_receive_timeout",
                  [] { return long{tavo_osal_socket_set_receive_timeout(g_socket, 10)}; },
                  {option("Set socket option failed\n, errno: 92")}),
        on_stream("tavo_osal_socket_set_send_timeout",
                  [] { return long{tavo_osal_socket_set_send_timeout(g_socket, 10)}; },
                  {option("Set socket option failed, Errno:92 \n")}),
        on_stream("tavo_osal_socket_set_tcp_no_delay", [] { return long{tavo_osal_socket_set_tcp_no_delay(g_socket)}; },
                  {option("Set socket option failed errno: 92")}),
        on_stream("tavo_osal_socket_get_buf_len",
                  [] {
                      unsigned length = 0;
                      return long{tavo_osal_socket_get_buf_len(g_socket, &length)};
                  },
                  {on({"getsockopt"},
                      {fails(TAVO_SOCKET_OPTION_FAILED, {error("Get socket option failed, errno: 105\n")})})}),
        on_stream("tavo_osal_socket_set_recv_buf_len",
                  [] { return long{tavo_osal_socket_set_recv_buf_len(g_socket, 8192)}; },
                  {option("Set socket option failed, errno: 92\n")}),
        on_stream("tavo_osal_socket_set_send_buf_len",
                  [] { return long{tavo_osal_socket_set_send_buf_len(g_socket, 8192)}; },
                  {option("Set socket option failed, errno: 92\n")}),
        on_stream(
            "tavo_osal_socket_reset", [] { return long{tavo_osal_socket_reset(g_socket)}; },
            {on({"setsockopt"}, {fails(TAVO_SOCKET_CLOSE_FAILED, {error("setsockopt(SO_LINGER) failed:92\n")})})}),
        // Where the interface may not be changed, as in most sandboxes, the second call fails by itself.
        on_stream("tavo_osal_socket_set_nw_iface_state",
                  [] { return long{tavo_osal_socket_set_nw_iface_state(g_socket, "lo", 1)}; },
                  {on({"ioctl"},
                      {fails(TAVO_FAILURE, {error("Error in bringing getting the n/w interface(lo) flags(22 "
                                                  "-> Invalid argument)\n")})},
                      1),
                   on({"ioctl"},
                      {fails(TAVO_FAILURE, {error("Error in bringing up the n/w interface(lo)(22 -> Invalid "
                                                  "argument)\n")})},
                      2)}),
        {"tavo_osal_validate_ipv4", {{"", nullptr, [] { return long{tavo_osal_validate_ipv4(kHost)}; }, nullptr, {}}}},
    };
}

std::vector<Row> transfer_rows() {
    const Outcome not_sent = fails(-1, {error("Socket Send Failed. Errno: 32.\n")});
    const Line not_received = error("Socket Recieve Failed. Errno: 104.\n");
    const Line nothing_there = error("Socket Recieve Failed. Errno: 11.\n");
    return {
        {"tavo_osal_socket_send",
         {{"",
           make_pair,
           [] { return long{tavo_osal_socket_send(g_socket, "x", 1, 0)}; },
           close_all,
           {on({"send"}, {not_sent})}}}},
        {"tavo_osal_socket_recieve",
         {{"",
           make_pair_with_a_byte,
           [] { return long{tavo_osal_socket_recieve(g_socket, g_byte, 1, 0)}; },
           close_all,
           {on_error("recv", ECONNRESET, {fails(-1, {not_received})}),
            // Tried again, up to three times in all.
            on_error("recv", EAGAIN, {same_but({nothing_there})})}},
          {"nothing comes",
           make_pair,
           [] { return long{tavo_osal_socket_recieve(g_socket, g_byte, 1, MSG_DONTWAIT)}; },
           close_all,
           {on_error("recv", ECONNRESET, {fails(-1, {not_received})}), on_error("recv", EAGAIN, {same()})}}}},
        {"tavo_osal_socket_recieve_without_retry",
         {{"",
           make_pair_with_a_byte,
           [] { return long{tavo_osal_socket_recieve_without_retry(g_socket, g_byte, 1, 0)}; },
           close_all,
           {on_error("recv", ECONNRESET, {fails(-1, {not_received})}),
            on_error("recv", EAGAIN, {fails(-1, {nothing_there})})}}}},
        {"tavo_osal_socket_sendto",
         {{"",
           make_datagrams,
           [] { return long{tavo_osal_socket_sendto(g_socket, kHost, g_port, "x", 1, 0)}; },
           close_all,
           {on({"sendto"}, {fails(-1, {error("Socket Send Failed. Errno: 105\n")})})}}}},
        {"tavo_osal_socket_receivefrom",
         {{"",
           make_datagrams_with_one,
           [] {
               char address[16];
               unsigned port = 0;
               return long{tavo_osal_socket_receivefrom(g_peer, g_byte, 1, 0, address, &port)};
           },
           close_all,
           {on({"recvfrom"}, {fails(-1, {not_received})})}}}},
        {"tavo_osal_socket_poll",
         {{"",
           make_pair_with_a_byte,
           [] {
               pollfd slot = {g_socket, POLLIN, 0};
               return long{tavo_osal_socket_poll(&slot, 1, 0)};
           },
           close_all,
           {on({"poll"}, {fails(-1)})}}}},
        {"tavo_osal_socket_wait_for_data",
         {{"",
           make_pair_with_a_byte,
           [] { return long{tavo_osal_socket_wait_for_data(g_socket, 0)}; },
           close_all,
           {on({"select"}, {fails(TAVO_SOCKET_SELECT_FAILED, {error("Select failed with error. Errno: 4.\n")})})}}}},
        {"tavo_osal_socket_wait_for_sending_data",
         {{"",
           make_pair,
           [] { return long{tavo_osal_socket_wait_for_sending_data(g_socket, 0)}; },
           close_all,
           {on({"select"}, {fails(TAVO_SOCKET_SELECT_FAILED, {error("Select failed with error. Errno:4 \n")})})}}}},
        {"tavo_osal_unix_domain_socket_sendto",
         {{"",
           [] {
               g_peer = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
               tavo_osal_unix_domain_socket_bind(g_peer, kPath);
               g_socket = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
           },
           [] { return long{tavo_osal_unix_domain_socket_sendto(g_socket, kPath, "x", 1)}; },
           [](long) {
               close_all(0);
               remove(kPath);
           },
           {on({"sendto"}, {fails(TAVO_SOCKET_SEND_FAILED, {error("Error in writing to unix domain socket. errno=105, "
                                                                  "iRet=-1,  iSize=1\n")})})}}}},
    };
}

}  // namespace

std::vector<Row> socket_rows() {
    std::vector<Row> rows = life_rows();
    for (auto* more : {option_rows, transfer_rows}) {
        for (Row& row : more()) rows.push_back(std::move(row));
    }
    return rows;
}

}  // namespace tavo::test::faults
