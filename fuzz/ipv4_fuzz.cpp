// Feeds texts to the IPv4 validation and stops at the first one it judges otherwise than the model does.
#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <vector>

#include "net/ipv4_model.h"
#include "tavo_osal/log.h"
#include "tavo_osal/network.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    // Almost every text is refused: written out, the reasons would be all a fuzzer has time for.
    g_uiMxEnabledLogLevel = 0;
    // A block of exactly the text's size, beside which nothing may be read. A zero in it ends the text early.
    std::vector<char> text(size + 1, '\0');
    std::copy(data, data + size, text.begin());
    const TAVO_Status status = tavo_osal_validate_ipv4(text.data());
    const TAVO_Status expected = tavo::test::Ipv4Model::judge(text.data()).status;
    if (status != expected) {
        fprintf(stderr, "\"%s\": %#x, but %#x by the model\n", text.data(), static_cast<unsigned>(status),
                static_cast<unsigned>(expected));
        abort();
    }
    return 0;
}
