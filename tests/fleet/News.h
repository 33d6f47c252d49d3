// SPDX-License-Identifier: Apache-2.0
// The store of a made-up device: weeks, as the service would have kept them, and what it adds later.
#pragma once

#include <cstddef>
#include <cstdint>
#include <filesystem>

namespace fleet {

// Makes a file with so many sessions in the weeks before `now`.
void makeStore(const std::filesystem::path& store, std::uint32_t seed, std::size_t sessions, double now);
// So many sessions that have ended by `now`, each with messages and a stretch, and one message without a session.
void addNews(const std::filesystem::path& store, int sessions, double now);

} // namespace fleet
