// What a peer may ask this process to hold. Both directions keep to them: a message that breaks one is not sent.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>

namespace docuvend::linux_platform {

inline constexpr std::uint32_t kProtocolVersion = 2;

inline constexpr std::size_t kMaximumFrameBytes = std::size_t{1} << 20U;   // all that follows the length
inline constexpr std::size_t kMaximumTextBytes = std::size_t{1} << 16U;    // one string, URL, dictionary key or error text
inline constexpr std::size_t kMaximumNesting = 32;                         // arrays, dictionaries and underlying errors in one another
inline constexpr std::size_t kMaximumElements = std::size_t{1} << 14U;     // values and error texts of one frame, all levels together
inline constexpr std::size_t kMaximumDescriptors = 16;                     // of one frame
inline constexpr std::size_t kMaximumPendingCalls = 1024;                  // requests of one direction without an answer yet
inline constexpr std::size_t kMaximumCallBytes = std::size_t{4} << 20U;    // of such requests that a peer has made
inline constexpr std::size_t kMaximumOutputBytes = std::size_t{4} << 20U;  // written for a peer and not taken by it yet
// The same; while there are more, this end asks nothing further of the peer. So what this end asks alone never ends the connection.
inline constexpr std::size_t kMaximumOutputBeforeRequest = kMaximumOutputBytes / 2;
// The same of a peer that is not trusted; while there are more, nothing further of what it says is looked at.
inline constexpr std::size_t kMaximumOutputBeforeFrame = std::size_t{1} << 16U;
// The same, of answers with descriptors that are due to it, or were sent and are not taken by it yet.
inline constexpr std::size_t kMaximumUntakenAnswers = 4;
inline constexpr std::chrono::milliseconds kTurn{1};              // after which further frames wait until others have had theirs
inline constexpr std::size_t kReadBytes = std::size_t{1} << 16U;  // taken from a socket at a time

}  // namespace docuvend::linux_platform
