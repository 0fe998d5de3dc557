#pragma once

#include "base/Format.h"
#include "bridge/alsa/kernel/Pcm.h"
#include "tests/Files.h"

#include <cstdio>
#include <filesystem>
#include <string>
#include <string_view>

#include <fcntl.h>

namespace tamblo::alsa::test {

/// What a status file says.
struct Status {
    std::string_view state = "RUNNING";
    int owner = 100;
    double trigger = 0; ///< seconds
    double written = 0;
    long mostAvailable = 512;
    long position = 0;
};

/// A directory with the kernel's files of one sound card and its processes, and one with its nodes.
class KernelTree {
public:
    KernelTree() {
        put("asound/cards", " 0 [PCH            ]: HDA-Intel - HDA Intel PCH\n"
                            "                      HDA Intel PCH at 0xf7e10000 irq 31\n"
                            " 1 [Loopback       ]: Loopback - Loopback\n"
                            "                      Loopback 1\n");
        std::filesystem::create_directories(devices());
        process(100, "player", 100);
    }

    [[nodiscard]] std::string processes() const { return directory_.path("proc"); }
    [[nodiscard]] std::string devices() const { return directory_.path("dev/snd"); }
    void put(const std::string& path, std::string_view content) {
        tamblo::test::writeFile(directory_.path("proc/" + path), std::string(content));
    }
    /// Replaces it in one step, as the kernel's files are never half of one.
    void replace(const std::string& path, std::string_view content) {
        put(path + ".new", content);
        std::filesystem::rename(directory_.path("proc/" + path + ".new"), directory_.path("proc/" + path));
    }
    void process(int id, const std::string& program, int group) {
        const std::string place = std::to_string(id) + "/";
        put(place + "status", formatted("Name:\tthread\nTgid:\t{}\nPid:\t{}\n", group, id));
        if (id == group) {
            std::filesystem::create_symlink("/usr/bin/" + program, directory_.path("proc/" + place + "exe"));
        }
    }

    /// A device's substream that nobody has open.
    void pcm(const PcmName& name, std::string_view device = "ALC257 Analog") {
        put(place(name, "info"), formatted("card: {}\ndevice: {}\nid: {}\nname: {}\nsubname: subdevice #0\n",
                                           name.card, name.device, device, device));
        close(name);
    }
    void close(const PcmName& name) {
        replace(place(name, "hw_params"), "closed\n");
        replace(place(name, "status"), "closed\n");
    }
    void format(const PcmName& name, std::string_view sample = "S16_LE", int channels = 2, int rate = 48000) {
        replace(
            place(name, "hw_params"),
            formatted("access: RW_INTERLEAVED\nformat: {}\nsubformat: STD\nchannels: {}\nrate: {} ({}/1)\n"
                      "period_size: 1024\nbuffer_size: 4096\n",
                      sample, channels, rate, rate));
    }
    void status(const PcmName& name, const Status& status) {
        char times[96] = {};
        std::snprintf(times, sizeof times, "trigger_time: %.9f\ntstamp      : %.9f\n", status.trigger,
                      status.written);
        replace(
            place(name, "status"),
            formatted("state: {}\nowner_pid   : {}\n{}delay       : 0\navail       : 0\navail_max   : {}\n"
                      "-----\nhw_ptr      : {}\nappl_ptr    : {}\n",
                      status.state, status.owner, times, status.mostAvailable, status.position,
                      status.position));
    }
    void remove(const PcmName& name) {
        std::filesystem::remove_all(
            directory_.path("proc/" + place(name, "status"))
                .erase(directory_.path("proc/" + place(name, "status")).rfind("/sub")));
    }
    [[nodiscard]] static std::string node(const PcmName& name) {
        return formatted("pcmC{}D{}{}", name.card, name.device, name.isInput ? "c" : "p");
    }
    [[nodiscard]] static std::string place(const PcmName& name, std::string_view file) {
        return formatted("asound/card{}/pcm{}{}/sub{}/{}", name.card, name.device, name.isInput ? "c" : "p",
                         name.substream, file);
    }

private:
    const TemporaryDirectory directory_;
};

} // namespace tamblo::alsa::test
