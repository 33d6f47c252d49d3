// SPDX-License-Identifier: Apache-2.0
// Message stores made from plain payloads, and their content as plain dictionaries.
#pragma once

#include "session/MessageStore.h"
#include "support/PrintValues.h"

#include <gtest/gtest.h>
#include <memory>
#include <string>
#include <utility>
#include <vector>

using Messages = std::vector<foundation::Dictionary>;

// A store of all these payloads: they are errors, which are recorded even if they repeat.
inline std::unique_ptr<session::MessageStore> storeOf(const Messages& payloads)
{
    auto store =
        std::make_unique<session::MessageStore>(std::make_shared<session::StorageBudget>(std::size_t{1} << 30));
    for (const auto& payload : payloads)
        EXPECT_EQ(store->record(AudioEventCategoryError, 1, payload), session::MessageStore::Outcome::Recorded);
    return store;
}

// Identifier to payload, one entry each.
inline Messages messagesOf(const session::MessageStore& store)
{
    Messages messages;
    store.forEach([&](const session::MessageStore::Message& message) {
        messages.push_back({{foundation::String(store.identifier(message)), message.payload.dictionary()}});
    });
    return messages;
}

// A text that differs whenever anything differs: order of entries, kinds of numbers, and values that equal nothing.
inline std::vector<std::string> textsOf(const Messages& dictionaries)
{
    std::vector<std::string> texts;
    for (const auto& dictionary : dictionaries)
        texts.push_back(foundation::Value(dictionary).text());
    return texts;
}
