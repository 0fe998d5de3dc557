#pragma once

#include "metrics/ProtoReader.h"
#include "metrics/ProtoTextFormatter.h"
#include "metrics/ProtoWriter.h"

#include <string_view>

namespace tamblo {

/// A Protocol Buffers message (proto2) that can be read, written and shown. Messages are values: what a
/// message is made of is copied and moved by its own class.
class ProtoMessageBase {
public:
    virtual ~ProtoMessageBase() = default;

    /// Adds what the bytes say to what the message says already. False when they are cut short or cannot be
    /// understood; what was read before that stays.
    [[nodiscard]] virtual bool readFrom(ProtoReader& reader) = 0;
    virtual void writeTo(ProtoWriter& writer) const = 0;
    /// As an object of that name.
    virtual void formatText(ProtoTextFormatter& formatter, std::string_view name) const = 0;

protected:
    ProtoMessageBase() = default;
    ProtoMessageBase(const ProtoMessageBase&) = default;
    ProtoMessageBase(ProtoMessageBase&&) = default;
    ProtoMessageBase& operator=(const ProtoMessageBase&) = default;
    ProtoMessageBase& operator=(ProtoMessageBase&&) = default;
};

} // namespace tamblo
