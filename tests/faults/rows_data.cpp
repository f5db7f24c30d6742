// Exported names that are no functions of their own.
#include "faults/row.h"

namespace tavo::test::faults {

std::vector<Row> data_rows() {
    constexpr const char* kSetting = "a variable of the log's";
    constexpr const char* kType = "data of the compiler's about a class";
    constexpr const char* kThunk = "moves the object's address and goes on to the function, which has a row";
    constexpr const char* kText = "a text, made when the library is loaded: see the library's own loading";
    constexpr const char* kEmpty = "a base's, without anything of its own: goes with the proxies and services";
    std::vector<Row> rows;
    for (const char* name :
         {"g_acFilePath", "g_fpLogCallback", "g_pvCallbackParam", "g_uiEnabledModuleMask", "g_uiEnvValueRead",
          "g_uiFileSize", "g_uiFirstTime", "g_uiMxEnabledLogLevel", "g_uiOutputStreamId", "g_uiPerformance",
          "guiMaxFileSize", "tv1", "tv2", "uiTotalTimeMilliSecs", "uiTotalTimeSecs"}) {
        rows.push_back({name, {}, kSetting});
    }
    for (const char* name : {"VTT for android::BnTavoBinder", "VTT for android::BpTavoBinder",
                             "VTT for android::ITavoBinder", "VTT for android::TavoOsalService",
                             "typeinfo for android::BnTavoBinder", "typeinfo for android::BpTavoBinder",
                             "typeinfo for android::ITavoBinder", "typeinfo for android::TavoOsalService",
                             "typeinfo name for android::BnTavoBinder", "typeinfo name for android::BpTavoBinder",
                             "typeinfo name for android::ITavoBinder", "typeinfo name for android::TavoOsalService",
                             "vtable for android::BnTavoBinder", "vtable for android::BpTavoBinder",
                             "vtable for android::ITavoBinder", "vtable for android::TavoOsalService"}) {
        rows.push_back({name, {}, kType});
    }
    for (const char* name :
         {"non-virtual thunk to android::BnTavoBinder::onTransact(unsigned int, android::Parcel const&, "
          "android::Parcel*, unsigned int)",
          "non-virtual thunk to android::BpTavoBinder::~BpTavoBinder()",
          "non-virtual thunk to android::TavoOsalService::dump(int, android::Vector<android::String16> const&)",
          "non-virtual thunk to android::TavoOsalService::~TavoOsalService()",
          "virtual thunk to android::BpTavoBinder::~BpTavoBinder()",
          "virtual thunk to android::ITavoBinder::~ITavoBinder()",
          "virtual thunk to android::TavoOsalService::~TavoOsalService()"}) {
        rows.push_back({name, {}, kThunk});
    }
    rows.push_back({"android::ITavoBinder::descriptor", {}, kText});
    rows.push_back({"android::ITavoBinder::ITavoBinder()", {}, kEmpty});
    rows.push_back({"android::ITavoBinder::~ITavoBinder()", {}, kEmpty});
    return rows;
}

}  // namespace tavo::test::faults
