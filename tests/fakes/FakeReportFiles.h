#pragma once

#include "platform/ReportFiles.h"

#include <cstddef>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// Report files in memory. Each step can be made to fail, with the text that a test sets for it.
class FakeReportFiles final : public ReportFiles {
public:
    [[nodiscard]] std::string reportingLogsDirectory() const override { return "/reports"; }
    [[nodiscard]] std::string performanceLogsDirectory() const override { return "/performance"; }
    [[nodiscard]] std::optional<std::string> createDirectory(const std::string& path) override {
        createdDirectories.push_back(path);
        return directoryFailure;
    }
    [[nodiscard]] std::variant<std::unique_ptr<ReportFile>, std::string>
    createFile(const std::string& path) override {
        if (openFailure) {
            return *openFailure;
        }
        files[path].clear();
        return std::make_unique<File>(*this, files[path]);
    }

    std::map<std::string, std::string> files; ///< the contents by path
    std::vector<std::string> createdDirectories;
    std::optional<std::string> directoryFailure, openFailure, writeFailure, closeFailure;
    std::set<std::size_t> failingWrites; ///< those that the write failure is for, from 1; without any, all
    std::vector<std::size_t> writes;     ///< the length of each

private:
    class File final : public ReportFile {
    public:
        File(FakeReportFiles& owner, std::string& content) : owner_(owner), content_(content) {}
        [[nodiscard]] std::optional<std::string> write(std::string_view text) override {
            owner_.writes.push_back(text.size());
            const bool isMeant =
                owner_.failingWrites.empty() || owner_.failingWrites.contains(owner_.writes.size());
            if (owner_.writeFailure && isMeant) {
                return owner_.writeFailure;
            }
            content_ += text;
            return std::nullopt;
        }
        [[nodiscard]] std::optional<std::string> close() override { return owner_.closeFailure; }

    private:
        FakeReportFiles& owner_;
        std::string& content_;
    };
};

} // namespace tamblo
