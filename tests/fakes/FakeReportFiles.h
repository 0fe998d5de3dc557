#pragma once

#include "platform/ReportFiles.h"

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// Report files in memory. Each step can be made to fail, with the text that a test sets for it.
class FakeReportFiles final : public ReportFiles {
public:
    [[nodiscard]] std::string reportingLogsDirectory() const override { return "/reports"; }
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

private:
    class File final : public ReportFile {
    public:
        File(const FakeReportFiles& owner, std::string& content) : owner_(owner), content_(content) {}
        [[nodiscard]] std::optional<std::string> write(std::string_view text) override {
            if (!owner_.writeFailure) {
                content_ += text;
            }
            return owner_.writeFailure;
        }
        [[nodiscard]] std::optional<std::string> close() override { return owner_.closeFailure; }

    private:
        const FakeReportFiles& owner_;
        std::string& content_;
    };
};

} // namespace tamblo
