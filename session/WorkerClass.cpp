#include "session/WorkerClass.h"

#include "util/Log.h"

#include <algorithm>

namespace tamblo {

namespace {

WorkerClassLists sortOut() {
    WorkerClassLists lists;
    for (const WorkerClass& workerClass : workerClassList()) {
        if (workerClass.initWithSession == nullptr) {
            log::debug(ZRReportingSessionCategory(), "Worker does not implement initWithSession! {}",
                       workerClass);
            continue;
        }
        lists.valid.push_back(&workerClass);
        if (workerClass.startOnInit) {
            lists.startOnInit.push_back(&workerClass);
        }
    }
    return lists;
}

} // namespace

const WorkerClass* workerClassNamed(std::string_view name) noexcept {
    const std::span<const WorkerClass> classes = workerClassList();
    const auto found = std::find_if(classes.begin(), classes.end(), [name](const WorkerClass& workerClass) {
        return workerClass.name == name;
    });
    return found != classes.end() ? &*found : nullptr;
}

const WorkerClassLists& workerClassLists() {
    static const WorkerClassLists lists = sortOut();
    return lists;
}

void appendText(std::string& out, const WorkerClass& workerClass) {
    out += workerClass.name;
}

} // namespace tamblo
