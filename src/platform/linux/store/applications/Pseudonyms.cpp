// SPDX-License-Identifier: Apache-2.0
// The key's file is written whole or not at all. A file of another length holds no key, and is replaced.
#include "platform/linux/store/applications/Pseudonyms.h"

#include "platform/linux/files/FilesAt.h"
#include "platform/linux/files/SmallFile.h"
#include "platform/linux/files/SystemError.h"
#include "platform/linux/store/applications/KeyedHash.h"

#include <cstdio>
#include <fcntl.h>
#include <system_error>
#include <unistd.h>

namespace platform {
namespace {

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
    const std::filesystem::path path = directory / fileName;
    auto present = readSmallFile(path, hashKeyBytes);
    if (present && present->size() == hashKeyBytes) {
        key_ = *std::move(present);
        return;
    }
    key_ = randomHashKey();
    if (const std::error_code error = writeKey(directory, key_))
        log.error("{} cannot be made: {}; the pseudonyms of applications last until the service ends", path.native(),
                  error.message());
}

std::string Pseudonyms::of(std::string_view name) const
{
    return "app-" + keyedHash(key_, name);
}

} // namespace platform
