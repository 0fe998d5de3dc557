#pragma once

#include <string>
#include <string_view>

#include <sys/stat.h>

namespace tamblo {

/// What a replaced file outlives: the end of the process, or, after waiting for the disk, a loss of power.
enum class Durability { process, power };

/// Replaces a file, or makes a new one, in one step: whoever reads the path sees the old content or the new,
/// also after a crash in between. Returns 0 or an `errno`, after which the old content stands.
///
/// The content is written to another file of the same directory first and renamed; that file's name begins
/// with a dot and has no file name extension, so that whoever looks for names of their own in the directory
/// passes over it. A replaced file's mode is kept, and its owner where this process may give it away; a new
/// file is its owner's alone (0600). The directory has to be there. Any thread.
[[nodiscard]] int replaceFileAtomically(const std::string& path, std::string_view content,
                                        Durability durability = Durability::process);
/// The same of an entry of an open directory; a new file has this mode.
[[nodiscard]] int replaceFileAtomically(int directory, const std::string& name, std::string_view content,
                                        Durability durability = Durability::process,
                                        mode_t mode = S_IRUSR | S_IWUSR);

} // namespace tamblo
