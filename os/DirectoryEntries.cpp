#include "os/DirectoryEntries.h"

#include <cerrno>
#include <memory>
#include <string_view>

#include <dirent.h>

namespace tamblo {

DirectoryEntries DirectoryEntries::read(const std::string& path, std::size_t most) {
    const std::unique_ptr<DIR, int (*)(DIR*)> directory(::opendir(path.c_str()), ::closedir);
    if (directory == nullptr) {
        return {errno};
    }
    DirectoryEntries entries;
    while (const dirent* entry = ::readdir(directory.get())) {
        const std::string_view name = entry->d_name;
        if (name == "." || name == "..") {
            continue;
        }
        if (entries.names.size() == most) {
            entries.isCut = true;
            break;
        }
        entries.names.emplace_back(name);
    }
    return entries;
}

} // namespace tamblo
