#include "base/UniqueFunction.h"
#include "tests/base/AllocationCount.h"

#include <gtest/gtest.h>

#include <array>
#include <memory>

namespace tamblo {
namespace {

TEST(UniqueFunction, HoldsMovesAndDestroysItsTarget) {
    for (const bool large : {false, true}) {
        auto token = std::make_shared<int>(1);
        const std::weak_ptr<int> watched = token;
        UniqueFunction<int(std::unique_ptr<int>)> function;
        EXPECT_FALSE(function);
        if (large) {
            function = [token, ballast = std::array<char, 100>{}](std::unique_ptr<int> add) {
                return ++*token + *add + ballast[99];
            };
        } else {
            const auto spent = test::allocationsOf(
                [&] { function = [token](std::unique_ptr<int> add) { return ++*token + *add; }; });
            EXPECT_EQ(spent.blocks, 0U);
        }
        token.reset();
        EXPECT_EQ(function(std::make_unique<int>(10)), 12);
        auto moved = std::move(function);
        EXPECT_FALSE(function);
        EXPECT_EQ(moved(std::make_unique<int>(10)), 13);
        auto& self = moved;
        moved = std::move(self);
        EXPECT_EQ(watched.use_count(), 1);
        UniqueFunction<int(std::unique_ptr<int>)> last([](std::unique_ptr<int>) { return 0; });
        last = std::move(moved);
        EXPECT_EQ(last(std::make_unique<int>(0)), 4);
        last.reset();
        EXPECT_TRUE(watched.expired());
        EXPECT_FALSE(last);
    }
}

} // namespace
} // namespace tamblo
