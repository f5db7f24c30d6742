/* Which texts are usable IPv4 addresses. */
#include <stdio.h>
#include <tavo_osal.h>

int main(void) {
    static const char* const texts[] = {"192.168.1.10", "0.0.0.0", "256.1.1.1", "1.2.3", "10.0.0.255"};
    for (unsigned int i = 0; i < sizeof texts / sizeof *texts; ++i) {
        printf("%-12s %s\n", texts[i], tavo_osal_validate_ipv4(texts[i]) == TAVO_SUCCESS ? "usable" : "refused");
    }
    return 0;
}
