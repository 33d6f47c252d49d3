// SPDX-License-Identifier: Apache-2.0
// The key's file is written whole or not at all. A file of another length holds no key, and is replaced.
#include "platform/linux/store/applications/Pseudonyms.h"

#include "platform/linux/files/FilesAt.h"
#include "platform/linux/files/SmallFile.h"
#include "platform/linux/files/SystemError.h"

#include <array>
#include <cstdint>
#include <cstdio>
#include <fcntl.h>
#include <fmt/format.h>
#include <fmt/ranges.h>
#include <gcrypt.h>
#include <memory>
#include <new>
#include <system_error>
#include <unistd.h>

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

std::string randomKey()
{
    std::string key(Pseudonyms::keyBytes, '\0');
    gcry_randomize(key.data(), key.size(), GCRY_VERY_STRONG_RANDOM);
    return key;
}

std::error_code writeKey(const std::filesystem::path& directory, const std::string& key)
{
    const FileDescriptor folder(::open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!folder)
        return systemError();
    const std::string unfinished = temporaryName();
    std::error_code error = writeFileAt(folder.get(), unfinished, key, ReadableBy::Owner);
    if (!error && ::renameat(folder.get(), unfinished.c_str(), folder.get(), Pseudonyms::fileName.data()) != 0)
        error = systemError();
    if (error)
        ::unlinkat(folder.get(), unfinished.c_str(), 0);
    else
        ::fsync(folder.get());
    return error;
}

} // namespace

Pseudonyms::Pseudonyms(const std::filesystem::path& directory, ProviderLog log)
{
    initializeLibrary();
    const std::filesystem::path path = directory / fileName;
    auto present = readSmallFile(path, keyBytes);
    if (present && present->size() == keyBytes) {
        key_ = *std::move(present);
        return;
    }
    key_ = randomKey();
    if (const std::error_code error = writeKey(directory, key_))
        log.error("{} cannot be made: {}; the pseudonyms of applications last until the service ends", path.native(),
                  error.message());
}

std::string Pseudonyms::of(std::string_view name) const
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
    if (!isOpen || gcry_mac_setkey(opened, key_.data(), key_.size()) != 0
        || gcry_mac_write(opened, name.data(), name.size()) != 0 || gcry_mac_read(opened, first.data(), &size) != 0)
        throw std::bad_alloc(); // nothing else can fail
    return fmt::format("app-{:02x}", fmt::join(first, ""));
}

} // namespace platform
