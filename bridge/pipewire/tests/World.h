#pragma once

#include "bridge/pipewire/graph/Graph.h"
#include "bridge/pipewire/graph/Properties.h"
#include "bridge/pipewire/report/Reporter.h"
#include "bridge/pipewire/report/Time.h"

#include <initializer_list>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo::pipewire::test {

using Properties = std::initializer_list<std::pair<std::string_view, std::string_view>>;

class HandClock final : public Clock {
public:
    [[nodiscard]] Moment now() const override { return now_; }
    void advance(std::chrono::milliseconds time) {
        now_.steady += time;
        now_.wall += time;
    }

private:
    Moment now_{SteadyTime(std::chrono::hours(1)), WallTime(std::chrono::seconds(1'700'000'000))};
};

/// Keeps what was reported.
class KeptReports final : public Reporter {
public:
    struct Session {
        ServiceType serviceType;
        std::string application;
        bool hasEnded = false;
    };
    struct Message {
        SessionID session;
        std::string category;
        std::string type;
        Dictionary payload;
        WallTime at;
    };

    [[nodiscard]] bool isReachable() const override { return isThere; }
    [[nodiscard]] SessionID begin(ServiceType serviceType, const std::string& application) override {
        if (!isThere) {
            return kNoSession;
        }
        sessions.push_back({serviceType, application});
        return static_cast<SessionID>(sessions.size());
    }
    void send(SessionID session, EventCategory category, EventType type, Dictionary payload,
              WallTime at) override {
        if (session != kNoSession) {
            messages.push_back({session, client::categoryName(category), std::string(client::typeName(type)),
                                std::move(payload), at});
        }
    }
    void end(SessionID session) override {
        sessions.at(static_cast<std::size_t>(session - 1)).hasEnded = true;
    }

    /// "1 Session_Playback Start, ..."
    [[nodiscard]] std::string story() const {
        std::string text;
        for (const Message& message : messages) {
            text += (text.empty() ? "" : ", ") + std::to_string(message.session) + " " + message.category +
                    " " + message.type;
        }
        return text;
    }

    bool isThere = true;
    std::vector<Session> sessions;
    std::vector<Message> messages;
};

/// A graph, and how to put things into it as the server's side does.
struct World {
    void node(ObjectID id, Properties properties, NodeState state = NodeState::running) {
        graph.changeNode(id, [&](Node& node) {
            node.isKnown = true;
            node.state = state;
            for (const auto& [key, value] : properties) {
                takeProperty(node, key, value);
            }
        });
    }
    void stream(ObjectID id, Properties properties = {}) {
        node(id, {{"media.class", "Stream/Output/Audio"}});
        node(id, properties);
    }
    void sink(ObjectID id, std::string_view name) {
        node(id, {{"media.class", "Audio/Sink"}, {"node.description", name}});
    }
    void link(ObjectID from, ObjectID to) { graph.addLink(1000 * from + to, {.output = from, .input = to}); }
    void unlink(ObjectID from, ObjectID to) { graph.remove(1000 * from + to); }

    Graph graph;
};

} // namespace tamblo::pipewire::test
