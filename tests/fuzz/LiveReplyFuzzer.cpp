// The live-rule reply handler on any reply. Input: the relay path on the first line, then the
// VCA plugin's reply text.
#include "FuzzInput.h"
#include "PluginQuenvarDefs.h"
#include "QUILImplementation/VcaRuleRetrieverPrivate.h"

#include <cstdlib>

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    // Failure reports go through the filter, not to the terminal.
    if (qEnvironmentVariableIsEmpty("KALBLOG_LEVEL"))
        qputenv("KALBLOG_LEVEL", "1");
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    const FuzzInput input = FuzzInput::split(data, size);
    int calls = 0;
    QVariantMap result;
    VcaRuleRetriever::VcaRuleRetrieverPrivate::queryLiveVCARuleCB(
        true, input.first, QStringLiteral("0"), input.rest, true,
        [&](bool, const QString&, const QString&, const QVariant& payload) {
            ++calls;
            result = payload.toMap();
        });
    // One answer, always the four entries, the relay path as delivered, XML text in XML form.
    const bool xmlForm = result.value(VCA_KEY_RULES).toString().startsWith(QLatin1String("<?xml"));
    if (calls != 1 || result.size() != 4 || result.value(VCA_KEY_RELAY_PATH) != input.first ||
        xmlForm == result.value(VCA_KEY_IS_JSON).toBool())
        std::abort();
    return 0;
}
