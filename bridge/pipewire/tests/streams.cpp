// A client of PipeWire for the tests: plays silence or records, by as many streams as are asked for, with
// whatever properties.
//
//     streams COUNT SECONDS [KEY=VALUE...]
//
// The seconds begin when the server knows all streams, however long that takes a busy one; at most ten
// seconds are waited for it.
//
// KEY may be `capture`, which has the streams record; `bare`, which has them carry nothing but what they need
// to be linked; `long`, which adds properties of 64 KiB; `broken`, which adds some that are not UTF-8;
// `oversleep=MS`, which has the first stream sleep so long in the thread that moves sound, once a second.

#include <array>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include <pipewire/pipewire.h>
#include <spa/param/audio/format-utils.h>

namespace {

constexpr std::uint32_t kRate = 48000;
constexpr std::uint32_t kFrameBytes = 4; ///< two channels of 16 bits

/// How long it takes, and the loop that ends then.
struct Length {
    pw_main_loop* loop = nullptr;
    spa_source* timer = nullptr;
    timespec seconds{};
    unsigned unknown = 0; ///< streams that the server does not know yet

    void beginWith(timespec time) const {
        pw_loop_update_timer(pw_main_loop_get_loop(loop), timer, &time, nullptr, false);
    }
};

struct Player {
    Length* length = nullptr;
    bool isKnown = false;
    pw_stream* stream = nullptr;
    spa_hook hook{};
    unsigned oversleepMilliseconds = 0;
    std::time_t lastSleep = 0;
};

void process(void* data) {
    auto& player = *static_cast<Player*>(data);
    pw_buffer* const buffer = pw_stream_dequeue_buffer(player.stream);
    if (buffer == nullptr) {
        return;
    }
    spa_data& block = buffer->buffer->datas[0];
    if (block.data != nullptr && block.chunk != nullptr) {
        std::uint32_t frames = block.maxsize / kFrameBytes;
        frames = buffer->requested != 0
                     ? std::min<std::uint32_t>(frames, static_cast<std::uint32_t>(buffer->requested))
                     : frames;
        std::memset(block.data, 0, frames * kFrameBytes);
        block.chunk->offset = 0;
        block.chunk->stride = kFrameBytes;
        block.chunk->size = frames * kFrameBytes;
    }
    pw_stream_queue_buffer(player.stream, buffer);
    if (player.oversleepMilliseconds != 0 && std::time(nullptr) != player.lastSleep) {
        player.lastSleep = std::time(nullptr);
        const timespec time{0, static_cast<long>(player.oversleepMilliseconds) * 1'000'000};
        nanosleep(&time, nullptr);
    }
}

void stateChanged(void* data, pw_stream_state, pw_stream_state state, const char*) {
    auto& player = *static_cast<Player*>(data);
    if (state >= PW_STREAM_STATE_PAUSED && !player.isKnown) {
        player.isKnown = true;
        if (--player.length->unknown == 0) {
            player.length->beginWith(player.length->seconds);
        }
    }
}

constexpr pw_stream_events kEvents = [] {
    pw_stream_events events{};
    events.version = PW_VERSION_STREAM_EVENTS;
    events.process = process;
    events.state_changed = stateChanged;
    return events;
}();

struct Options {
    unsigned count = 1;
    double seconds = 1;
    bool isCapture = false;
    bool isBare = false;
    unsigned oversleepMilliseconds = 0;
    std::vector<std::pair<std::string, std::string>> properties;
};

Options parse(int argc, char* argv[]) {
    Options options;
    options.count = argc > 1 ? static_cast<unsigned>(std::atoi(argv[1])) : 1;
    options.seconds = argc > 2 ? std::atof(argv[2]) : 1;
    for (int i = 3; i < argc; ++i) {
        const std::string_view word = argv[i];
        const std::size_t equals = word.find('=');
        if (word == "capture") {
            options.isCapture = true;
        } else if (word == "bare") {
            options.isBare = true;
        } else if (word == "long") {
            for (const char* const key :
                 {"media.role", "application.id", "media.name", "node.description", "some.key"}) {
                options.properties.emplace_back(key, std::string(65536, 'x'));
            }
        } else if (word == "broken") {
            for (const char* const key : {"media.role", "application.id", "application.name", "node.name"}) {
                options.properties.emplace_back(key, "\xff\xfe broken \xc3\x28 \x1b[31m");
            }
        } else if (word.starts_with("oversleep=")) {
            options.oversleepMilliseconds = static_cast<unsigned>(std::atoi(argv[i] + equals + 1));
        } else if (equals != std::string_view::npos) {
            options.properties.emplace_back(word.substr(0, equals), word.substr(equals + 1));
        }
    }
    return options;
}

bool begin(Player& player, pw_core* core, const Options& options) {
    pw_properties* const properties = pw_properties_new(nullptr, nullptr);
    if (!options.isBare) {
        pw_properties_set(properties, PW_KEY_MEDIA_TYPE, "Audio");
        pw_properties_set(properties, PW_KEY_MEDIA_CATEGORY, options.isCapture ? "Capture" : "Playback");
    }
    for (const auto& [key, value] : options.properties) {
        pw_properties_set(properties, key.c_str(), value.c_str());
    }
    player.stream = pw_stream_new(core, options.isBare ? nullptr : "streams", properties);
    if (player.stream == nullptr) {
        return false;
    }
    pw_stream_add_listener(player.stream, &player.hook, &kEvents, &player);
    std::array<std::uint8_t, 1024> memory;
    spa_pod_builder builder{};
    spa_pod_builder_init(&builder, memory.data(), static_cast<std::uint32_t>(memory.size()));
    spa_audio_info_raw format{};
    format.format = SPA_AUDIO_FORMAT_S16;
    format.rate = kRate;
    format.channels = 2;
    format.position[0] = SPA_AUDIO_CHANNEL_FL;
    format.position[1] = SPA_AUDIO_CHANNEL_FR;
    const spa_pod* parameter = spa_format_audio_raw_build(&builder, SPA_PARAM_EnumFormat, &format);
    return pw_stream_connect(
               player.stream, options.isCapture ? PW_DIRECTION_INPUT : PW_DIRECTION_OUTPUT, PW_ID_ANY,
               static_cast<pw_stream_flags>(PW_STREAM_FLAG_AUTOCONNECT | PW_STREAM_FLAG_MAP_BUFFERS |
                                            PW_STREAM_FLAG_RT_PROCESS),
               &parameter, 1) == 0;
}

} // namespace

int main(int argc, char* argv[]) {
    const Options options = parse(argc, argv);
    pw_init(nullptr, nullptr);
    pw_main_loop* const loop = pw_main_loop_new(nullptr);
    pw_context* const context = pw_context_new(pw_main_loop_get_loop(loop), nullptr, 0);
    pw_core* const core = pw_context_connect(context, nullptr, 0);
    if (core == nullptr) {
        return EXIT_FAILURE;
    }
    const auto end = [](void* data, std::uint64_t) { pw_main_loop_quit(static_cast<pw_main_loop*>(data)); };
    const auto whole = static_cast<std::time_t>(options.seconds);
    constexpr std::time_t mostWait = 10;
    Length length{.loop = loop,
                  .timer = pw_loop_add_timer(pw_main_loop_get_loop(loop), end, loop),
                  .seconds = {whole, static_cast<long>((options.seconds - static_cast<double>(whole)) * 1e9)},
                  .unknown = options.count};
    length.beginWith({whole + mostWait, length.seconds.tv_nsec});
    std::vector<std::unique_ptr<Player>> players;
    for (unsigned i = 0; i < options.count; ++i) {
        auto& player = players.emplace_back(std::make_unique<Player>());
        player->length = &length;
        player->oversleepMilliseconds = i == 0 ? options.oversleepMilliseconds : 0;
        if (!begin(*player, core, options)) {
            return EXIT_FAILURE;
        }
    }
    pw_main_loop_run(loop);
    for (const auto& player : players) {
        pw_stream_destroy(player->stream);
    }
    pw_context_destroy(context);
    pw_main_loop_destroy(loop);
    pw_deinit();
    return EXIT_SUCCESS;
}
