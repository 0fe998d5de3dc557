#include "Runner.h"

#include <algorithm>
#include <cstdio>
#include <exception>
#include <iterator>
#include <stdexcept>
#include <utility>

#include <unistd.h>

namespace tamblo::bench {

namespace {

/// The rows of each measurement, in the order in which they came first.
std::vector<Rounds> roundsOf(const std::vector<ResultRow>& rows) {
    std::vector<std::vector<ResultRow>> groups;
    for (const ResultRow& row : rows) {
        const auto group = std::find_if(groups.begin(), groups.end(), [&](const auto& candidate) {
            return isSameMeasurement(candidate.front(), row);
        });
        if (group != groups.end()) {
            group->push_back(row);
        } else {
            groups.push_back({row});
        }
    }
    return {std::make_move_iterator(groups.begin()), std::make_move_iterator(groups.end())};
}

} // namespace

Runner::Runner(const Options& options)
    : options_(options),
      bench_(options.tamblod, options.quick, options.attacks, [this](const ResultRow& row) { tell(row); }) {
    if (!options.against.empty()) {
        builds_.push_back({options.against, "before", {}});
    }
    builds_.push_back({options.tamblod, "after", {}});
    for (const Build& build : builds_) {
        if (::access(build.program.c_str(), X_OK) != 0) {
            throw std::runtime_error("cannot run " + build.program);
        }
    }
    if (!options.jsonFile.empty()) {
        json_.open(options.jsonFile);
        if (!json_) {
            throw std::runtime_error("cannot write " + options.jsonFile);
        }
    }
}

void Runner::run() {
    for (const Scenario* scenario : options_.scenarios) {
        run(*scenario);
    }
    const std::string table =
        builds_.size() == 1 ? tableOf(rows_) : comparisonOf(builds_[0].rounds, builds_[1].rounds);
    std::printf("\n%s", table.c_str());
}

std::vector<StoragePlace> Runner::placesOf(const Scenario& scenario) const {
    std::vector<StoragePlace> places;
    if (scenario.storages == Storages::none) {
        return {{}};
    }
    std::transform(options_.storages.begin(), options_.storages.end(), std::back_inserter(places),
                   findStorage);
    if (scenario.storages == Storages::one) {
        // The last one that is there: the disk, if it was asked for.
        while (places.size() > 1) {
            places.erase(places.back().directory.empty() ? places.end() - 1 : places.begin());
        }
    }
    return places;
}

void Runner::run(const Scenario& scenario) {
    bool isFirst = true;
    for (const StoragePlace& place : placesOf(scenario)) {
        if (scenario.storages != Storages::none && place.directory.empty()) {
            ResultRow row(scenario.name);
            row.set("storage", describe(place.storage));
            row.set("not_run", place.whyThereIsNone);
            tell(row);
            builds_.back().rounds.emplace_back(std::vector{row});
            continue;
        }
        if (builds_.size() == 1 && options_.rounds == 1) {
            bench_.useStorage(place, isFirst);
            runOnce(scenario, bench_);
        } else {
            runRounds(scenario, place, isFirst);
        }
        isFirst = false;
    }
}

void Runner::runRounds(const Scenario& scenario, const StoragePlace& place, bool isFirstPlace) {
    std::vector<std::vector<ResultRow>> rows(builds_.size());
    for (std::size_t round = 0; round < options_.rounds; ++round) {
        for (std::size_t turn = 0; turn < builds_.size(); ++turn) {
            const std::size_t number = (round + turn) % builds_.size();
            // With floors of its own, as the machine is not as fast at all times.
            Bench bench(builds_[number].program, options_.quick, options_.attacks,
                        [&rows, number](const ResultRow& row) { rows[number].push_back(row); });
            bench.useStorage(place, isFirstPlace);
            runOnce(scenario, bench);
        }
    }
    for (std::size_t number = 0; number < builds_.size(); ++number) {
        for (Rounds& rounds : roundsOf(rows[number])) {
            ResultRow row = rounds.median;
            row.set("rounds", std::uint64_t{rounds.each.size()});
            if (builds_.size() > 1) {
                row.set("build", builds_[number].name);
            }
            tell(row);
            builds_[number].rounds.push_back(std::move(rounds));
        }
    }
}

void Runner::runOnce(const Scenario& scenario, Bench& bench) {
    try {
        scenario.run(bench);
    } catch (const std::exception& error) {
        ResultRow row(scenario.name);
        if (scenario.storages != Storages::none) {
            row.set("storage", describe(bench.storage()));
        }
        row.set("error", error.what());
        bench.print(row);
        allRan_ = false;
    }
}

void Runner::tell(const ResultRow& row) {
    const std::string line = row.text();
    std::puts(line.c_str());
    std::fflush(stdout);
    if (json_.is_open()) {
        json_ << line << std::endl;
    }
    rows_.push_back(row);
}

} // namespace tamblo::bench
