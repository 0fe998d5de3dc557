#pragma once

namespace tamblo {

/// Whether the device runs an internal build. The device is asked once; without an answer it does not. Any
/// thread.
[[nodiscard]] bool ZRReportingUtilityIsInternalBuild();
/// Makes the next call ask the device again: after another platform was installed.
void forgetInternalBuild() noexcept;

} // namespace tamblo
