#include "base/ReplyError.h"

#include "base/Format.h"

namespace tamblo {

ReplyError limitReached(std::string_view name, std::size_t limit) {
    return {std::string(kProtocolErrorDomain), kLimitReached, formatted("{}: at most {}", name, limit)};
}

} // namespace tamblo
