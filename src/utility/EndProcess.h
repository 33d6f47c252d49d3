// SPDX-License-Identifier: Apache-2.0
// What every end of the process has in common, whether it ends in order or in the middle of its work.
#pragma once

namespace utility {

// Logs what was lost: the events whose loss the log does not show yet, and in one line all that was lost since the
// start. Waits until the log is written, at most a second. Any thread.
void reportLosses();

// Reports the losses, and ends the process with that status immediately, because other threads are running: nothing is
// destroyed. It waits for the log as above. Acknowledged events are kept already. Any thread.
[[noreturn]] void endProcess(int status);

} // namespace utility
