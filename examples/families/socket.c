/* A message over a connection to this process itself. */
#include <netinet/in.h>
#include <stdio.h>
#include <tavo_osal.h>

int main(void) {
    char buffer[16] = "";
    int listener = -1;
    int sender = -1;
    struct sockaddr_in address;
    socklen_t length = sizeof address;
    char loopback[] = "127.0.0.1";
    if (tavo_osal_socket_create(AF_INET, SOCK_STREAM, 0, &listener) != TAVO_SUCCESS) return 1;
    if (tavo_osal_socket_create(AF_INET, SOCK_STREAM, 0, &sender) != TAVO_SUCCESS) return 1;
    if (tavo_osal_socket_bind(listener, loopback, 0) != TAVO_SUCCESS) return 1; /* any port that is free */
    if (tavo_osal_socket_listen(listener, 1) != TAVO_SUCCESS) return 1;
    if (getsockname(listener, (struct sockaddr*)&address, &length) != 0) return 1;
    if (tavo_osal_socket_connect(sender, loopback, ntohs(address.sin_port)) != TAVO_SUCCESS) return 1;
    const int receiver = tavo_osal_socket_accept(listener, NULL, NULL);
    if (receiver < 0) return 1;

    printf("sent %d bytes\n", tavo_osal_socket_send(sender, "hello", 5, 0));
    printf("data within a second: %d\n", (int)tavo_osal_socket_wait_for_data(receiver, 1000));
    const int received = tavo_osal_socket_recieve_without_retry(receiver, buffer, sizeof buffer, 0);
    printf("received %.*s\n", received, buffer);
    tavo_osal_socket_close(receiver);
    tavo_osal_socket_close(sender);
    return tavo_osal_socket_close(listener) == TAVO_SUCCESS ? 0 : 1;
}
