// Feeds texts to the IPv4 validation and stops at the first one it judges otherwise than the model does.
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "net/ipv4_model.h"
#include "tavo_osal/log.h"
#include "tavo_osal/network.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    // Almost every text is refused: written out, the reasons would be all a fuzzer has time for.
    g_uiMxEnabledLogLevel = 0;
    // The text ends at its first zero, and sits in a block of its own size, beside which nothing may be read.
    const std::string bytes(reinterpret_cast<const char*>(data), size);
    const std::string text(bytes.c_str());
    const TAVO_Status status = tavo_osal_validate_ipv4(text.c_str());
    const TAVO_Status expected = tavo::test::Ipv4Model::judge(text).status;
    if (status != expected) {
        fprintf(stderr, "\"%s\": %#x, but %#x by the model\n", text.c_str(), static_cast<unsigned>(status),
                static_cast<unsigned>(expected));
        abort();
    }
    return 0;
}
