// SPDX-License-Identifier: Apache-2.0
// Watches first and then reads, so that no change is missed in between.
#include "platform/linux/settings/WatchedTomlFile.h"

namespace platform {

WatchedTomlFile::WatchedTomlFile(ConfigurationWatcher& watcher, std::string_view fileName, ProviderLog log,
                                 ChangeHandler changeHandler)
    : path_(watcher.root() / fileName),
      changeHandler_(std::move(changeHandler)),
      file_(path_, log),
      watch_(watcher.watch({}, [this, name = path_.filename()](std::string_view changed) {
          if (changed.empty() || changed == name.native())
              reload();
      }))
{
    const foundation::Lock lock(lock_);
    file_.reload();
}

foundation::Dictionary WatchedTomlFile::values() const
{
    const foundation::Lock lock(lock_);
    return file_.values();
}

void WatchedTomlFile::reload()
{
    bool isChanged = false;
    {
        const foundation::Lock lock(lock_);
        isChanged = file_.reload();
    }
    if (isChanged && changeHandler_)
        changeHandler_();
}

} // namespace platform
