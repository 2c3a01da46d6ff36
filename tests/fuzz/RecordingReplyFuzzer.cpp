// The recording-rule reply handler on any status and reply. Input: the status code text on the
// first line, then the VCA plugin's reply text.
#include "FuzzInput.h"
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
    QString code;
    QVariant payload;
    VcaRuleRetriever::VcaRuleRetrieverPrivate::queryRecordingVCARuleCB(
        true, input.first, input.rest, true,
        [&](bool, const QString& answerCode, const QString&, const QVariant& answerPayload) {
            ++calls;
            code = answerCode;
            payload = answerPayload;
        });
    // One answer: "0" with a map of locations, or "-1" with nothing.
    const bool ok = code == QLatin1String("0");
    if (calls != 1 || ok != (payload.typeId() == QMetaType::QVariantMap) ||
        (!ok && code != QLatin1String("-1")))
        std::abort();
    return 0;
}
