#include "tools/export/RecordIdentifiers.h"

#include "base/Format.h"
#include "base/Sha256.h"

#include <cstddef>

namespace tamblo::tools {

namespace {

constexpr std::size_t kFileDigits = 16;
constexpr std::size_t kCheckDigits = 8;
/// Of a line: its time and a little more.
constexpr std::size_t kCheckedBytes = 32;

} // namespace

RecordIdentifiers::RecordIdentifiers(std::string_view device, std::string_view sink,
                                     std::string_view fileIdentity, std::string_view secret) {
    const std::string hash = sha256(formatted("tamblo file {} {}", fileIdentity, secret));
    prefix_ = formatted("{}/{}/{}/", device, sink, std::string_view(hash).substr(0, kFileDigits));
    key_ = hash.substr(kFileDigits, kFileDigits);
}

std::string RecordIdentifiers::of(std::uint64_t offset, std::string_view line) const {
    const std::string hash = sha256(formatted("{}{}", key_, line.substr(0, kCheckedBytes)));
    return formatted("{}{}-{}", prefix_, offset, std::string_view(hash).substr(0, kCheckDigits));
}

} // namespace tamblo::tools
