// Text form of network addresses.
#include "qz/cu.h"

#include <arpa/inet.h>

int cu_ipaddr_ntop_1(const void *address16, char *out) {
    if (address16 == nullptr || out == nullptr)
        return CU_BAD_PARAMETER;
    // With room for the longest text this cannot fail.
    inet_ntop(AF_INET6, address16, out, INET6_ADDRSTRLEN);
    return CU_OK;
}
