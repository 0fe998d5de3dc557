#pragma once

#include "platform/Preferences.h"
#include "util/Context.h"
#include "util/LogCategories.h"

#include <optional>
#include <string_view>

namespace tamblo {

[[nodiscard]] PreferencesSuite capturePreferences(const Context& context);

/// A value that is to be read as a number, or as a flag, if it is set. One of another kind, such as an array,
/// is answered as well, and reads as `Value` has it; the category gets one error line for it, and another
/// only when the value has changed. Any thread.
[[nodiscard]] std::optional<Value> numberPreference(Context& context, std::string_view key,
                                                    const LogCategory& category);
[[nodiscard]] std::optional<Value> flagPreference(Context& context, std::string_view key,
                                                  const LogCategory& category);

} // namespace tamblo
