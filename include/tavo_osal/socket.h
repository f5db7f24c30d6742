/**
 * @file
 * Sockets: the BSD socket calls, with failures logged and mapped to the library's codes.
 *
 * Descriptors belong to the caller; no function closes one, whatever fails, except tavo_osal_socket_close().
 * Every failure is logged once with the tag "OSAL_SOCKET" at level 1, with errno as the platform left it, and
 * errno is still that value when the function returns. Nothing is retried except by
 * tavo_osal_socket_recieve(). Descriptors made here are close-on-exec.
 *
 * The functions that answer with a byte count answer -1 when they fail; where a status code shares a
 * function's result with a count or a descriptor, the function's own documentation says so.
 *
 * A null pointer where one is needed is refused before the platform is called: "Invalid parameter\n" is
 * logged and the answer is #TAVO_INVALID_PARAM, or -1 from the functions that answer with a byte count.
 * Buffers, poll arrays and accept's address are not checked: the platform refuses bad ones with EFAULT.
 *
 * The public names spell "recieve" so, and stay so: programs are linked to them.
 *
 * Every function may be called from any thread, with the one exception documented at
 * tavo_osal_socket_connect() and tavo_osal_socket_bind(). Ports are in host byte order, and only their low
 * 16 bits count.
 */
#ifndef TAVO_OSAL_SOCKET_H
#define TAVO_OSAL_SOCKET_H

#include <poll.h>
#include <sys/socket.h>

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/** @name Making, naming and closing
 *  @{ */

/**
 * socket(), close-on-exec.
 * @param iDomain    address family, such as AF_INET
 * @param iType      type, such as SOCK_STREAM; may carry SOCK_NONBLOCK
 * @param iProtocol  protocol, 0 for the type's own
 * @param piSocketFd receives the descriptor, or -1
 * @retval TAVO_SUCCESS              the socket was made
 * @retval TAVO_INVALID_PARAM        piSocketFd is null
 * @retval TAVO_SOCKET_CREATE_FAILED socket() failed
 */
TAVO_API TAVO_Status tavo_osal_socket_create(int iDomain, int iType, int iProtocol, int* piSocketFd);

/**
 * Resolves a host name and connects to it over IPv4.
 *
 * The name is resolved by gethostbyname(), whose result is one for the whole process: calls of this function
 * and tavo_osal_socket_bind() at the same time can be given one another's address. Serialise them.
 *
 * @param iSocketFd  an IPv4 socket
 * @param pcHostName host name or dotted address
 * @param uiPort     port
 * @retval TAVO_SUCCESS               connected
 * @retval TAVO_INVALID_PARAM         pcHostName is null, or has no IPv4 address; for the latter h_errno is logged
 * @retval TAVO_SOCKET_CONNECT_FAILED connect() failed
 */
TAVO_API TAVO_Status tavo_osal_socket_connect(int iSocketFd, const TAVO_CHAR* pcHostName, unsigned int uiPort);

/**
 * Resolves a host name and binds to it over IPv4. Names are resolved as tavo_osal_socket_connect() does, with
 * the same exception about threads.
 * @param iSocketFd  an IPv4 socket
 * @param pcHostName host name or dotted address of this machine
 * @param uiPort     port, 0 for any free one
 * @retval TAVO_SUCCESS               bound
 * @retval TAVO_INVALID_PARAM         pcHostName is null, or has no IPv4 address; for the latter h_errno is logged
 * @retval TAVO_SOCKET_CONNECT_FAILED bind() failed
 */
TAVO_API TAVO_Status tavo_osal_socket_bind(int iSocketFd, const TAVO_CHAR* pcHostName, unsigned int uiPort);

/**
 * Binds a netlink socket to this process's id and to all 32 multicast groups.
 * @param iSocketFd a netlink socket; a process can bind one for each netlink protocol
 * @retval TAVO_SUCCESS               bound
 * @retval TAVO_SOCKET_CONNECT_FAILED bind() failed
 */
TAVO_API TAVO_Status tavo_osal_nl_socket_bind(int iSocketFd);

/**
 * listen().
 * @param iSocketFd a bound socket
 * @param iBacklog  connections that may wait to be accepted
 * @retval TAVO_SUCCESS listening
 * @retval TAVO_FAILURE listen() failed
 */
TAVO_API TAVO_Status tavo_osal_socket_listen(int iSocketFd, int iBacklog);

/**
 * accept(), close-on-exec.
 *
 * Codes and descriptors share the result. The codes are above any descriptor of a process that may open fewer
 * than 36,866 (0x9002) of them.
 *
 * @param iSocketFd      a listening socket
 * @param pAddress       receives the peer's address; may be null
 * @param pAddressLength in: room at pAddress; out: the address's length; null when pAddress is
 * @return the new descriptor, which the caller closes; TAVO_INVALID_PARAM when iSocketFd is 0;
 *         TAVO_SOCKET_CONNECT_FAILED when accept() failed
 */
TAVO_CHECK_RESULT TAVO_API int tavo_osal_socket_accept(int iSocketFd, struct sockaddr* pAddress,
                                                       socklen_t* pAddressLength);

/**
 * shutdown() of both directions. The descriptor stays open.
 * @param iSocketFd a connected socket
 * @retval TAVO_SUCCESS             shut down
 * @retval TAVO_INVALID_PARAM       iSocketFd is 0 or negative
 * @retval TAVO_SOCKET_CLOSE_FAILED shutdown() failed
 */
TAVO_API TAVO_Status tavo_osal_socket_shutdown(int iSocketFd);

/**
 * Makes a later close send a reset (RST) instead of an orderly end: SO_LINGER, on, with a time of 0. The
 * socket is not closed here.
 * @param iSocketFd a connected TCP socket
 * @retval TAVO_SUCCESS             set
 * @retval TAVO_INVALID_PARAM       iSocketFd is 0 or negative
 * @retval TAVO_SOCKET_CLOSE_FAILED setsockopt() failed
 */
TAVO_API TAVO_Status tavo_osal_socket_reset(int iSocketFd);

/**
 * close(), except for descriptor 0: that one is left open and the answer is success.
 * @param iSocketFd the descriptor; after any other failure than a bad descriptor it is closed all the same
 * @retval TAVO_SUCCESS             closed, or iSocketFd is 0
 * @retval TAVO_INVALID_PARAM       iSocketFd is negative
 * @retval TAVO_SOCKET_CLOSE_FAILED close() failed
 */
TAVO_API TAVO_Status tavo_osal_socket_close(int iSocketFd);

/** @} */
/** @name Sending and receiving
 *  @{ */

/**
 * send(). A peer that is gone raises SIGPIPE unless iFlags holds MSG_NOSIGNAL.
 * @param iSocketFd a connected socket
 * @param pvBuffer  the bytes
 * @param uiLength  how many
 * @param iFlags    flags of send()
 * @return the bytes sent, which may be fewer; -1 when send() failed
 */
TAVO_API int tavo_osal_socket_send(int iSocketFd, const void* pvBuffer, unsigned int uiLength, int iFlags);

/**
 * recv(), tried up to three times in a row, without a pause, while it fails with EAGAIN. Each failure is logged.
 * @param iSocketFd a socket
 * @param pvBuffer  receives the bytes
 * @param uiLength  its size
 * @param iFlags    flags of recv()
 * @return the bytes received, 0 when the peer has closed; -1 when recv() failed
 */
TAVO_API int tavo_osal_socket_recieve(int iSocketFd, void* pvBuffer, unsigned int uiLength, int iFlags);

/** recv(), once; otherwise as tavo_osal_socket_recieve(). */
TAVO_API int tavo_osal_socket_recieve_without_retry(int iSocketFd, void* pvBuffer, unsigned int uiLength, int iFlags);

/**
 * sendto() an IPv4 address.
 * @param iSocketFd   an IPv4 socket
 * @param pcIpAddress the receiver's address, in any form inet_aton() takes
 * @param uiPort      the receiver's port
 * @param pvBuffer    the bytes
 * @param uiLength    how many
 * @param iFlags      flags of sendto()
 * @return the bytes sent; -1 when pcIpAddress is null or not an address, or sendto() failed
 */
TAVO_API int tavo_osal_socket_sendto(int iSocketFd, const TAVO_CHAR* pcIpAddress, unsigned int uiPort,
                                     const void* pvBuffer, unsigned int uiLength, int iFlags);

/**
 * recvfrom() an IPv4 sender.
 *
 * The text is never longer than 15 characters and its terminator, whatever is received. On a socket that
 * gives no sender, such as a connected TCP one, it is "0.0.0.0" and the port is 0.
 *
 * @param iSocketFd   an IPv4 socket
 * @param pvBuffer    receives the bytes
 * @param uiLength    its size; the rest of a longer datagram is lost
 * @param iFlags      flags of recvfrom()
 * @param pcIpAddress receives the sender's address in dotted form; at least 16 bytes
 * @param puiPort     receives the sender's port
 * @return the bytes received; -1, with both outputs untouched, when an output is null or recvfrom() failed
 */
TAVO_API int tavo_osal_socket_receivefrom(int iSocketFd, void* pvBuffer, unsigned int uiLength, int iFlags,
                                          TAVO_CHAR* pcIpAddress, unsigned int* puiPort);

/** @} */
/** @name Waiting
 *  @{ */

/**
 * poll(). Logs nothing.
 * @param pPollFds   what to wait for
 * @param uiCount    its number of elements
 * @param iTimeoutMs milliseconds; negative: without limit
 * @return poll()'s result: elements with events, 0 when the time has passed, -1 on failure
 */
TAVO_API int tavo_osal_socket_poll(struct pollfd* pPollFds, unsigned int uiCount, int iTimeoutMs);

/**
 * Waits with select() until the socket can be read.
 * @param iSocketFd   a descriptor below FD_SETSIZE (1024). Any other fails as a failing select() does, with errno
 *                    EBADF for a negative one and EINVAL for a larger one; tavo_osal_socket_poll() takes those
 * @param uiTimeoutMs milliseconds, cut to whole seconds: below 1000 the state is looked up and the call returns
 *                    at once. 0: without limit
 * @retval TAVO_SUCCESS               there is something to read, the end or an error included
 * @retval TAVO_SOCKET_SELECT_TIMEOUT the time has passed
 * @retval TAVO_SOCKET_SELECT_FAILED  select() failed
 */
TAVO_API TAVO_Status tavo_osal_socket_wait_for_data(int iSocketFd, unsigned int uiTimeoutMs);

/** Waits with select() until the socket can be written; otherwise as tavo_osal_socket_wait_for_data(). */
TAVO_API TAVO_Status tavo_osal_socket_wait_for_sending_data(int iSocketFd, unsigned int uiTimeoutMs);

/** @} */
/** @name Options
 *  @{ */

/**
 * setsockopt() of an int at SOL_SOCKET.
 * @param iSocketFd   a socket
 * @param iOptionName option, such as SO_REUSEADDR
 * @param iValue      its value
 * @retval TAVO_SUCCESS set
 * @retval TAVO_FAILURE setsockopt() failed
 */
TAVO_API TAVO_Status tavo_osal_socket_setoption(int iSocketFd, int iOptionName, int iValue);

/**
 * Limits how long a receive may block (SO_RCVTIMEO); past the limit it fails with EAGAIN.
 * @param iSocketFd   a socket
 * @param uiTimeoutMs milliseconds; 0: no limit
 * @retval TAVO_SUCCESS              set
 * @retval TAVO_SOCKET_OPTION_FAILED setsockopt() failed
 */
TAVO_API TAVO_Status tavo_osal_socket_set_receive_timeout(int iSocketFd, unsigned int uiTimeoutMs);

/** Limits how long a send may block (SO_SNDTIMEO); otherwise as tavo_osal_socket_set_receive_timeout(). */
TAVO_API TAVO_Status tavo_osal_socket_set_send_timeout(int iSocketFd, unsigned int uiTimeoutMs);

/**
 * Sends small segments at once (TCP_NODELAY).
 * @param iSocketFd a TCP socket
 * @retval TAVO_SUCCESS              set
 * @retval TAVO_SOCKET_OPTION_FAILED setsockopt() failed
 */
TAVO_API TAVO_Status tavo_osal_socket_set_tcp_no_delay(int iSocketFd);

/**
 * The size of the receive buffer (SO_RCVBUF).
 * @param iSocketFd a socket
 * @param puiLength receives the bytes; 0 when the call fails
 * @retval TAVO_SUCCESS              read
 * @retval TAVO_INVALID_PARAM        puiLength is null
 * @retval TAVO_SOCKET_OPTION_FAILED getsockopt() failed
 */
TAVO_API TAVO_Status tavo_osal_socket_get_buf_len(int iSocketFd, unsigned int* puiLength);

/**
 * Sets the size of the receive buffer (SO_RCVBUF). The kernel doubles what it is given, within its limits.
 * @param iSocketFd a socket
 * @param uiLength  bytes
 * @retval TAVO_SUCCESS              set
 * @retval TAVO_SOCKET_OPTION_FAILED setsockopt() failed
 */
TAVO_API TAVO_Status tavo_osal_socket_set_recv_buf_len(int iSocketFd, unsigned int uiLength);

/** Sets the size of the send buffer (SO_SNDBUF); otherwise as tavo_osal_socket_set_recv_buf_len(). */
TAVO_API TAVO_Status tavo_osal_socket_set_send_buf_len(int iSocketFd, unsigned int uiLength);

/** @} */
/** @name Unix-domain sockets
 *  A path is at most 108 bytes long, the size of its field in the address; it need not leave room for a
 *  terminator. A longer one is never copied: the call answers as when the platform refuses the address, with
 *  errno ENAMETOOLONG.
 *  @{ */

/**
 * Binds to a path, unless a file was there.
 *
 * The path is unlinked first. When that removed a file, the call fails without binding, and a second call then
 * binds: a server that finds a stale socket calls twice.
 *
 * @param iSocketFd              a Unix-domain socket
 * @param pcUnixDomainFilePath   the path
 * @retval TAVO_SUCCESS       bound
 * @retval TAVO_INVALID_PARAM pcUnixDomainFilePath is null
 * @retval TAVO_FAILURE       a file was removed, bind() failed, or the path is too long
 */
TAVO_API TAVO_Status tavo_osal_unix_domain_socket_bind(int iSocketFd, const TAVO_CHAR* pcUnixDomainFilePath);

/**
 * sendto() a Unix-domain path, without flags.
 *
 * Codes and counts share the result: a count of 36,866 or 37,382 bytes is not to be told from a failure.
 *
 * @param iSocketFd              a Unix-domain socket
 * @param pcUnixDomainFilePath   the receiver's path
 * @param pvBuffer               the bytes
 * @param uiLength               how many
 * @return uiLength, not 0, when all were sent; TAVO_INVALID_PARAM when pcUnixDomainFilePath is null;
 *         TAVO_SOCKET_SEND_FAILED when sendto() failed or sent fewer, or the path is too long
 */
TAVO_API int tavo_osal_unix_domain_socket_sendto(int iSocketFd, const TAVO_CHAR* pcUnixDomainFilePath,
                                                 const void* pvBuffer, unsigned int uiLength);

/** @} */

TAVO_END_DECLS

#endif
