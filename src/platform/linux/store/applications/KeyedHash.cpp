// SPDX-License-Identifier: Apache-2.0
// The hash is libgcrypt's.
#include "platform/linux/store/applications/KeyedHash.h"

#include <array>
#include <fmt/format.h>
#include <fmt/ranges.h>
#include <gcrypt.h>
#include <memory>
#include <new>

namespace platform {
namespace {

void initializeLibrary()
{
    [[maybe_unused]] static const bool done = [] {
        if (gcry_control(GCRYCTL_INITIALIZATION_FINISHED_P) == 0) {
            gcry_check_version(nullptr);
            gcry_control(GCRYCTL_DISABLE_SECMEM, 0);
            gcry_control(GCRYCTL_INITIALIZATION_FINISHED, 0);
        }
        return true;
    }();
}

} // namespace

std::string randomHashKey()
{
    initializeLibrary();
    std::string key(hashKeyBytes, '\0');
    gcry_randomize(key.data(), key.size(), GCRY_VERY_STRONG_RANDOM);
    return key;
}

std::string keyedHash(std::string_view key, std::string_view text)
{
    initializeLibrary();
    struct Close {
        void operator()(gcry_mac_hd_t mac) const { gcry_mac_close(mac); }
    };
    gcry_mac_hd_t opened = nullptr;
    std::array<unsigned char, 8> first{};
    std::size_t size = first.size();
    const bool isOpen = gcry_mac_open(&opened, GCRY_MAC_HMAC_SHA256, 0, nullptr) == 0;
    const std::unique_ptr<std::remove_pointer_t<gcry_mac_hd_t>, Close> mac(opened);
    if (!isOpen || gcry_mac_setkey(opened, key.data(), key.size()) != 0
        || gcry_mac_write(opened, text.data(), text.size()) != 0 || gcry_mac_read(opened, first.data(), &size) != 0)
        throw std::bad_alloc(); // nothing else can fail
    return fmt::format("{:02x}", fmt::join(first, ""));
}

} // namespace platform
