// SPDX-License-Identifier: Apache-2.0
// JSON for people, written piece by piece: indented, each member on its own line, and never in memory as a whole.
#pragma once

#include "foundation/cbor/CborView.h"
#include "foundation/values/Value.h"

#include <functional>
#include <memory>
#include <string_view>

namespace foundation {

// Calls come in the order of the text; one thread at a time.
class PrettyJsonWriter {
public:
    using Sink = std::function<void(std::string_view text)>;

    // The sink gets the text in pieces of some 64 KiB, the last when the writer is destroyed.
    explicit PrettyJsonWriter(Sink sink);
    ~PrettyJsonWriter();

    void beginArray();
    void endArray();
    void beginObject();
    void endObject();
    void key(std::string_view key);
    void write(const Value& value);
    void write(CborItem item);
    // A key and its value. Puts their text into `text`, which may be written in their place wherever the same number of
    // objects and arrays is open.
    void writeMember(std::string_view key, CborItem value, std::string& text);
    void writeMember(std::string_view text);

    // False after a value held NaN or infinity, which JSON cannot express. The text so far is then not usable, and the
    // writer writes no more.
    [[nodiscard]] bool isWhole() const;

private:
    class Implementation;
    std::unique_ptr<Implementation> implementation_;
};

} // namespace foundation
