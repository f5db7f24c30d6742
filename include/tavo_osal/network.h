/**
 * @file
 * Networks: bringing interfaces up and down, and checking IPv4 address texts.
 *
 * Both functions log with the tag "OSAL_SOCKET" and may be called from any thread.
 */
#ifndef TAVO_OSAL_NETWORK_H
#define TAVO_OSAL_NETWORK_H

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/**
 * Brings a network interface up or down. Its flags are read, IFF_UP is changed, and they are written back;
 * nothing is written when they could not be read.
 *
 * Needs the right to configure the network (CAP_NET_ADMIN). Reading and writing are two steps: a flag that
 * another process changes in between is set back.
 *
 * @param iSocketFd       any socket that takes interface requests, such as an IPv4 datagram one; stays the caller's
 * @param pcInterfaceName the interface's name, such as "lo". At most 16 bytes are taken, and the kernel looks
 *                        at no more than the first 15
 * @param iState          0: down; anything else: up
 * @retval TAVO_SUCCESS       the flags were written
 * @retval TAVO_INVALID_PARAM iSocketFd is 0 or negative, or pcInterfaceName is null
 * @retval TAVO_FAILURE       the flags could not be read or written; logged with errno and its text
 */
TAVO_API TAVO_Status tavo_osal_socket_set_nw_iface_state(int iSocketFd, const TAVO_CHAR* pcInterfaceName, int iState);

/**
 * Checks that a text is a usable IPv4 address in dotted decimal form.
 *
 * The text has 7 to 15 characters and holds four numbers of up to three characters, none above 255, with single
 * dots between them. Numbers are taken as scanf's "%3u" takes them: leading zeros, a sign, and blanks in front of
 * a number are accepted, and so are blanks at the end. "0.0.0.0" is refused, but no other spelling of it is.
 *
 * An address whose first number is above 0 and whose others are all 0 (a network) or all 255 (a broadcast
 * address) is valid, with a warning at level 2, whatever the address's class is.
 *
 * @param pcIpAddress the text; not changed
 * @retval TAVO_SUCCESS       a usable address
 * @retval TAVO_INVALID_PARAM pcIpAddress is null
 * @retval TAVO_FAILURE       not a usable address; the reason is logged at level 1
 */
TAVO_API TAVO_Status tavo_osal_validate_ipv4(const TAVO_CHAR* pcIpAddress);

TAVO_END_DECLS

#endif
