// SPDX-License-Identifier: Apache-2.0
// The environment comes first, then the usual places of the packaged service.
#include "wire/ServicePath.h"

#include "platform/linux/process/Environment.h"

#include <algorithm>
#include <string_view>
#include <sys/un.h>

namespace libkesto {
namespace {

constexpr std::string_view defaultServiceName = "com.quarn.kesto.reporting";

bool isSocketPath(const std::string& path)
{
    return path.size() < sizeof(sockaddr_un::sun_path) && path.find('\0') == std::string::npos;
}

} // namespace

std::expected<std::vector<std::string>, kesto_status> servicePaths(const std::string& socketPath,
                                                                   const std::string& serviceName)
{
    const std::string name = serviceName.empty() ? std::string(defaultServiceName) : serviceName;
    if (name.find('/') != std::string::npos)
        return std::unexpected(KESTO_INVALID_ARGUMENT);
    std::vector<std::string> paths;
    if (!socketPath.empty()) {
        paths = {socketPath};
    } else if (const std::string given = platform::environment("KESTO_SOCKET"); !given.empty()) {
        paths = {given};
    } else {
        if (const std::string runtime = platform::environment("XDG_RUNTIME_DIR"); !runtime.empty())
            paths.push_back(runtime + "/kesto/" + name);
        paths.push_back("/run/kesto/" + name);
    }
    if (!std::ranges::all_of(paths, isSocketPath))
        return std::unexpected(KESTO_INVALID_ARGUMENT);
    return paths;
}

} // namespace libkesto
