#pragma once

#include "base/Dictionary.h"

#include <chrono>
#include <cstddef>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>

namespace tamblo {

/// The file of one preferences domain, `<directory>/<domain>.json`: one JSON object, the domain's values by
/// key. The service and its tools change it here and nowhere else.
///
/// Whoever changes such a file holds the advisory lock (`flock`) of the directory from before the file is
/// read until it has been replaced, so that no change is lost; `flock DIRECTORY COMMAND` does so for a
/// script. Who only reads needs no lock. Any thread; editing waits for the lock, and for the disk.
class PreferenceFile {
public:
    /// Bytes; larger files are refused.
    static constexpr std::size_t kMaximumSize = 4U << 20U;
    static constexpr std::string_view kSuffix = ".json";

    /// Nothing for a domain whose name is not the name of a file in the directory and of nothing else.
    [[nodiscard]] static std::optional<PreferenceFile> of(std::string directory, std::string_view domain);

    [[nodiscard]] const std::string& path() const noexcept { return path_; }
    /// What the file holds, nothing if it is missing; or what is wrong, naming the file and the place.
    [[nodiscard]] std::variant<Dictionary, std::string> read() const;
    /// Gives the values as they stand in the file to `change` and, when that answers true, replaces the file
    /// by what it left: in one step, keeping mode and owner, and on the disk when this returns. Answers what
    /// went wrong, or nothing. A file that cannot be read as an object is somebody's mistake and is left as
    /// it is; so is one that cannot be replaced, or could not be read again.
    /// The lock is waited for without limit, unless one is given.
    [[nodiscard]] std::optional<std::string>
    edit(const std::function<bool(Dictionary&)>& change,
         std::optional<std::chrono::milliseconds> patience = {}) const;

private:
    PreferenceFile(std::string directory, std::string path)
        : directory_(std::move(directory)), path_(std::move(path)) {}

    std::string directory_;
    std::string path_;
};

} // namespace tamblo
