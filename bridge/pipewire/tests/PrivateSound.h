#pragma once

#include "bridge/common/tests/Program.h"
#include "bridge/pipewire/graph/Namespace.h"
#include "tests/service/RealService.h"

#include "base/Json.h"

#include <gtest/gtest.h>

#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::pipewire::test {

using namespace bridge::test;
using tamblo::test::contentOf;
using tamblo::test::eventually;
using tamblo::test::linesOf;
using tamblo::test::ServiceProcess;
using tamblo::test::writeFile;

[[nodiscard]] inline bool isInstalled(const std::string& program) {
    return tamblo::test::run("command -v " + program).status == 0;
}

/// A PipeWire with its session manager in directories of their own: two sinks and a source of no hardware,
/// "Speaker A", "Speaker B" and "Microphone". One at a time: it sets this process's environment.
class PrivateSound {
public:
    PrivateSound() {
        for (const auto& [name, place] :
             {std::pair("XDG_RUNTIME_DIR", "run"), std::pair("HOME", "home"),
              std::pair("XDG_CONFIG_HOME", "home/config"), std::pair("XDG_STATE_HOME", "home/state")}) {
            std::filesystem::create_directories(directory_.path(place));
            ::setenv(name, directory_.path(place).c_str(), 1);
        }
        ::unsetenv("PIPEWIRE_REMOTE");
        ::unsetenv("PIPEWIRE_RUNTIME_DIR");
        const std::string address = "unix:path=" + directory_.path("run/bus");
        ::setenv("DBUS_SESSION_BUS_ADDRESS", address.c_str(), 1);
        bus_ = std::make_unique<Program>(
            std::vector<std::string>{"dbus-daemon", "--session", "--nofork", "--address=" + address});
        const auto node = [](std::string_view name, std::string_view description,
                             std::string_view mediaClass) {
            return "{ factory = adapter args = { factory.name = support.null-audio-sink node.name = " +
                   std::string(name) + " node.description = \"" + std::string(description) +
                   "\" media.class = " + std::string(mediaClass) + " audio.position = [ FL FR ] } }\n";
        };
        writeFile(directory_.path("home/config/pipewire/pipewire.conf.d/devices.conf"),
                  "context.objects = [\n" + node("sink-a", "Speaker A", "Audio/Sink") +
                      node("sink-b", "Speaker B", "Audio/Sink") +
                      node("microphone", "Microphone", "Audio/Source/Virtual") + "]\n");
        // The machine's own devices are left alone.
        std::filesystem::copy(EXAMPLES_DIR "/pipewire/config/wireplumber",
                              directory_.path("home/config/wireplumber"),
                              std::filesystem::copy_options::recursive);
        startServer();
        startManager();
    }

    void startServer() {
        server_ = std::make_unique<Program>(std::vector<std::string>{"pipewire"}, log("pipewire"));
        if (!eventually([] { return tamblo::test::run("timeout 5 pw-cli info 0").status == 0; })) {
            throw std::runtime_error("PipeWire does not start: " + contentOf(log("pipewire")));
        }
    }
    void killServer() { server_->end(SIGKILL); }
    void pauseServer(bool isPaused) { ::kill(server_->pid(), isPaused ? SIGSTOP : SIGCONT); }
    void startManager() {
        manager_ = std::make_unique<Program>(std::vector<std::string>{"wireplumber"}, log("wireplumber"));
        if (!eventually([] { return contains("timeout 5 pw-metadata", "sink-"); })) {
            throw std::runtime_error("WirePlumber names no default sink: " + contentOf(log("wireplumber")));
        }
    }
    void killManager() { manager_->end(SIGKILL); }

    /// Silence of this length, in a file with a title for a name.
    [[nodiscard]] std::string song(std::chrono::milliseconds length) {
        const auto frames = static_cast<std::uint32_t>(48 * length.count());
        const std::uint32_t bytes = frames * 4;
        std::string file = "RIFF....WAVEfmt ....................data....";
        const auto put = [&file](std::size_t at, std::uint32_t number, std::size_t size) {
            for (std::size_t i = 0; i < size; ++i) {
                file[at + i] = static_cast<char>(number >> (8 * i));
            }
        };
        put(4, 36 + bytes, 4);
        put(16, 16, 4);
        put(20, 1, 2);
        put(22, 2, 2);
        put(24, 48000, 4);
        put(28, 48000 * 4, 4);
        put(32, 4, 2);
        put(34, 16, 2);
        put(40, bytes, 4);
        file.append(bytes, '\0');
        const std::string path = directory_.path("A secret song " + std::to_string(length.count()) + ".wav");
        writeFile(path, file);
        return path;
    }

    /// A node's number by its name, or a property of it.
    [[nodiscard]] std::string nodeNamed(const std::string& name, const std::string& property = "id") const {
        const std::string listed =
            tamblo::test::run(
                "timeout 5 pw-cli ls Node | awk -v name='node.name = \"" + name + "\"' '" +
                "/^\\tid /{id=$2; sub(\",\",\"\",id)} /object.serial/{serial=$3; gsub(\"\\\"\",\"\",serial)} "
                "index($0,name){print " +
                (property == "id" ? "id" : "serial") + "}'")
                .output;
        return listed.substr(0, listed.find('\n'));
    }
    void setVolume(const std::string& node, const std::string& volume) const {
        (void)tamblo::test::run("timeout 5 wpctl set-volume " + nodeNamed(node) + " " + volume);
    }
    void move(const std::string& streamID, const std::string& sinkSerial) const {
        (void)tamblo::test::run("timeout 5 pw-metadata " + streamID + " target.object " + sinkSerial);
    }

    [[nodiscard]] std::string log(const std::string& program) const {
        return directory_.path(program + ".log");
    }

    [[nodiscard]] static bool contains(const std::string& command, std::string_view text) {
        return tamblo::test::run(command).output.find(text) != std::string::npos;
    }

private:
    const TemporaryDirectory directory_;
    std::unique_ptr<Program> bus_;
    std::unique_ptr<Program> server_;
    std::unique_ptr<Program> manager_;
};

/// A private sound server, a real service, and the program between them, by this process's environment.
class OnPrivateServer : public testing::Test {
protected:
    explicit OnPrivateServer(bool isInternalBuild = false) : isInternalBuild_(isInternalBuild) {}

    void SetUp() override {
        for (const char* const program :
             {"pipewire", "wireplumber", "dbus-daemon", "pw-play", "pw-cli", "pw-metadata", "wpctl"}) {
            if (!isInstalled(program)) {
                GTEST_SKIP() << program << " is not installed";
            }
        }
        sound_ = std::make_unique<PrivateSound>();
        service_ =
            std::make_unique<ServiceProcess>(ServiceProcess::Options{.isInternalBuild = isInternalBuild_});
        ::setenv("RUNTIME_DIRECTORY", service_->runtimeDirectory().c_str(), 1);
        ::setenv("CONFIGURATION_DIRECTORY", service_->preferenceFile("x").parent_path().parent_path().c_str(),
                 1);
    }

    /// Returns when it has reached both.
    void startBridge() {
        bridge_ = std::make_unique<Program>(std::vector<std::string>{PROGRAMS_DIR "/tamblo-pipewire"},
                                            sound_->log("bridge"));
        ASSERT_TRUE(eventually([this] {
            const std::string said = contentOf(sound_->log("bridge"));
            return said.find("reports to") != std::string::npos && said.find("watches") != std::string::npos;
        }));
    }

    /// The payloads of an event that sessions of this application had, or of all whose names begin so.
    [[nodiscard]] std::vector<Dictionary> events(const std::string& name,
                                                 const std::string& application) const {
        std::vector<Dictionary> payloads;
        for (const std::string& line : linesOf(service_->logs() / "analytics-events.jsonl")) {
            const auto parsed = readJson(line);
            const Dictionary& event = std::get<Value>(parsed).dictionaryValue();
            const Dictionary& payload = event.find("payload")->dictionaryValue();
            const Value* const owner = payload.find("HostApplicationDisplayID");
            if (event.find("event")->stringValue() == "com.vandra.tamblo." + name && owner != nullptr &&
                owner->stringValue().starts_with(application)) {
                payloads.push_back(payload);
            }
        }
        return payloads;
    }

    const bool isInternalBuild_;
    std::unique_ptr<PrivateSound> sound_;
    std::unique_ptr<ServiceProcess> service_;
    std::unique_ptr<Program> bridge_;
};

} // namespace tamblo::pipewire::test
