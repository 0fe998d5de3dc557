#pragma once

#include <string>
#include <string_view>

namespace tamblo {

/// What is kept when the device loses its power.
enum class Durability {
    untilPowerLoss, ///< the kernel has it
    onDisk,         ///< the disk has it, which may take milliseconds
};

/// Replaces a file, or makes a new one, in one step: whoever reads the path sees the old content or the new,
/// also after a crash in between. Returns 0 or an `errno`, after which the old content stands (or the new
/// one, when nothing but making it last on the disk failed).
///
/// The content is written to another file of the same directory first and renamed; that file's name begins
/// with a dot and has no file name extension, so that whoever looks for names of their own in the directory
/// passes over it. A replaced file's mode is kept, a new file is its owner's alone (0600). The directory has
/// to be there. Any thread.
[[nodiscard]] int replaceFileAtomically(const std::string& path, std::string_view content,
                                        Durability durability);

} // namespace tamblo
