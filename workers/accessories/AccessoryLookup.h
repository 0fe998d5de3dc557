#pragma once

#include <string_view>

namespace tamblo {

inline constexpr std::string_view kAccessoryEvent = "com.vandra.tamblo.accessoryregistration";

/// Looks the device's wireless earbuds up and sends the analytics event for those that are due, unless nobody
/// wants the event, or the last lookup was within a minute, or one is under way: thousands of sessions may
/// start in a moment. Returns at once; the lookup reads files on another thread, and its events are sent on
/// the reporting server queue, so that they are written out with its batch. Any thread.
void lookUpAccessories();
/// Has the next call look whenever the last one was: after another platform was installed.
void forgetAccessoryLookup() noexcept;

} // namespace tamblo
