// SPDX-License-Identifier: Apache-2.0
// Signatures, which are the same for all providers.
#include "platform/BugCapture.h"

namespace platform {

foundation::Dictionary BugCaptureReporter::makeSignature(std::string_view domain, std::string_view type,
                                                         std::string_view subType, std::string_view subtypeContext,
                                                         std::string_view detectedProcess,
                                                         const std::optional<foundation::Value>& triggerThresholdValues)
{
    foundation::Dictionary signature{{"domain", domain},
                                     {"type", type},
                                     {"subType", subType},
                                     {"subtypeContext", subtypeContext},
                                     {"detectedProcess", detectedProcess}};
    return triggerThresholdValues ? signature.with("triggerThresholdValues", *triggerThresholdValues) : signature;
}

} // namespace platform
