// SPDX-License-Identifier: Apache-2.0
// The file is opened first and judged then, so that nobody exchanges it in between.
#include "kesto-uplink/transport/Credentials.h"

#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/settings/TomlFile.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <map>
#include <string_view>

namespace kesto_uplink {

namespace {

constexpr std::size_t mostBytes = 4096;

[[noreturn]] void fail(const std::filesystem::path& file, const std::string& what)
{
    throw CredentialsError(fmt::format("the credentials file {} {}", file.native(), what));
}

std::string contentsOf(const std::filesystem::path& file)
{
    const platform::FileDescriptor opened(::open(file.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
    if (!opened)
        fail(file, fmt::format("cannot be read: {}", std::strerror(errno)));
    struct stat facts = {};
    if (::fstat(opened.get(), &facts) != 0 || !S_ISREG(facts.st_mode))
        fail(file, "is no regular file");
    if ((facts.st_mode & S_IRWXO) != 0)
        fail(file, fmt::format("is open to all users of this device: chmod o= {}", file.native()));
    std::array<char, mostBytes> bytes = {};
    const ssize_t size = ::read(opened.get(), bytes.data(), bytes.size());
    if (size < 0)
        fail(file, fmt::format("cannot be read: {}", std::strerror(errno)));
    return {bytes.data(), static_cast<std::size_t>(size)};
}

bool isToken(std::string_view name)
{
    constexpr std::string_view allowed = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-_";
    return !name.empty() && name.find_first_not_of(allowed) == std::string_view::npos;
}

} // namespace

Credentials readCredentials(const std::filesystem::path& file)
{
    const auto values = platform::parseToml(contentsOf(file));
    if (!values)
        fail(file, fmt::format("is no TOML in line {}: {}", values.error().line, values.error().reason));
    Credentials credentials;
    const std::map<std::string_view, std::string*> texts{{"name", &credentials.name},
                                                         {"password", &credentials.password},
                                                         {"key", &credentials.publicKey},
                                                         {"seed", &credentials.seed}};
    for (const auto& [key, value] : *values) {
        const auto text = texts.find(key.view());
        if (key.view() == "plain") {
            if (value.kind() != foundation::Value::Kind::Number)
                fail(file, "has a plain that is not true or false");
            credentials.isPlain = value.asBoolean();
        } else if (text == texts.end())
            fail(file,
                 fmt::format("has the unknown key {}: it takes name, password or key and seed, and plain", key.view()));
        else if (value.stringView().empty())
            fail(file, fmt::format("has a {} that is not text", key.view()));
        else
            *text->second = value.stringView();
    }
    if (!isToken(credentials.name))
        fail(file, "needs a name of letters, digits, - and _");
    const bool hasKey = !credentials.publicKey.empty() && !credentials.seed.empty();
    const bool hasPartOfKey = !credentials.publicKey.empty() || !credentials.seed.empty();
    if (hasPartOfKey ? !hasKey || !credentials.password.empty() : credentials.password.empty())
        fail(file, "needs either a password, or a key (U...) and its seed (SU...)");
    return credentials;
}

} // namespace kesto_uplink
