#pragma once

#include "base/Value.h"
#include "os/FileDescriptor.h"
#include "tools/Command.h"
#include "tools/ServiceConnection.h"

#include <string>
#include <string_view>
#include <variant>

namespace tamblo::tools {

inline constexpr Option kStatusSocketOption{"--socket", "PATH",
                                            "the status socket, when it is not in its usual place"};

/// What the service tells on its status socket.
struct StatusDocument {
    std::string text; ///< a line of JSON
    Value value;

    /// A member of an object that may have others.
    [[nodiscard]] static const Value& member(const Value& object, std::string_view name);
    [[nodiscard]] const Value& operator[](std::string_view name) const { return member(value, name); }
};

/// Asks for one document, by the option for the socket where it is given.
class StatusConnection {
public:
    explicit StatusConnection(const Arguments& arguments);

    /// A connection on which the request has been sent.
    [[nodiscard]] std::variant<FileDescriptor, Unreachable> send(std::string_view request) const;
    [[nodiscard]] std::variant<StatusDocument, Unreachable> ask(std::string_view request) const;

private:
    const std::string path_;
};

} // namespace tamblo::tools
