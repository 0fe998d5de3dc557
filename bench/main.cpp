#include "Options.h"
#include "Runner.h"

#include <cstdio>
#include <exception>

int main(int count, char** arguments) {
    using namespace tamblo::bench;
    Options options;
    if (!options.parse(count, arguments)) {
        printUsage();
        return 2;
    }
    try {
        Runner runner(options);
        runner.run();
        return runner.allRan() ? 0 : 1;
    } catch (const std::exception& error) {
        std::fprintf(stderr, "tamblo_bench: %s\n", error.what());
        return 1;
    }
}
