// SPDX-License-Identifier: Apache-2.0
// There are two cases: usually a frame lies whole in the fed bytes; otherwise it began in an earlier read.
#include "platform/linux/connection/FrameReader.h"

#include <algorithm>
#include <array>
#include <cassert>

namespace platform {
namespace {

std::size_t announcedLength(std::string_view head) noexcept
{
    std::size_t length = 0;
    for (std::size_t index = frameHeadSize; index-- > 0;)
        length = length << 8 | static_cast<std::uint8_t>(head[index]);
    return length;
}

} // namespace

void appendFrame(std::string_view frame, std::string& out)
{
    assert(frame.size() <= longestFrame);
    std::array<char, frameHeadSize> head;
    for (std::size_t index = 0; index < frameHeadSize; ++index)
        head[index] = static_cast<char>(frame.size() >> 8 * index);
    out.append(head.data(), head.size()).append(frame);
}

void FrameReader::feed(std::string_view bytes) noexcept
{
    assert(fed_.empty());
    fed_ = bytes;
}

std::expected<std::optional<std::string_view>, FrameError> FrameReader::next()
{
    if (cutOffIsDone_) {
        std::string().swap(cutOff_); // rather than clear: an idle stream keeps no buffer
        cutOffIsDone_ = false;
    }
    if (!cutOff_.empty())
        return completeCutOff();
    if (fed_.size() >= frameHeadSize) {
        const std::size_t length = announcedLength(fed_);
        if (length > longestFrame)
            return std::unexpected(FrameError::TooLong);
        if (fed_.size() - frameHeadSize >= length) {
            const std::string_view frame = fed_.substr(frameHeadSize, length);
            fed_.remove_prefix(frameHeadSize + length);
            return frame;
        }
    }
    takeOver(fed_.size());
    return std::nullopt;
}

std::expected<std::optional<std::string_view>, FrameError> FrameReader::completeCutOff()
{
    takeOver(frameHeadSize);
    if (cutOff_.size() < frameHeadSize)
        return std::nullopt;
    const std::size_t length = announcedLength(cutOff_);
    if (length > longestFrame)
        return std::unexpected(FrameError::TooLong);
    takeOver(frameHeadSize + length);
    if (cutOff_.size() < frameHeadSize + length)
        return std::nullopt;
    cutOffIsDone_ = true;
    return std::string_view(cutOff_).substr(frameHeadSize);
}

// Moves fed bytes behind the held ones, until it holds so many.
void FrameReader::takeOver(std::size_t wanted)
{
    if (cutOff_.size() >= wanted)
        return;
    const std::size_t count = std::min(wanted - cutOff_.size(), fed_.size());
    cutOff_ += fed_.substr(0, count);
    fed_.remove_prefix(count);
}

} // namespace platform
