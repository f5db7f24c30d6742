#include "tavo_osal/cpp/shared_block.hpp"

#include <gtest/gtest.h>

#include <cstring>

#include "support/platform_fault.h"
#include "support/process.h"
#include "tavo_osal/init.h"

namespace {

using tavo::Errc;
using tavo::SharedBlock;
using tavo::test::count_mappings;
using tavo::test::PlatformHook;

static_assert(std::is_nothrow_move_constructible_v<SharedBlock> && !std::is_copy_constructible_v<SharedBlock>);

class CppSharedBlock : public testing::Test {
protected:
    CppSharedBlock() { EXPECT_EQ(tavo_osal_init(16, 16), TAVO_SUCCESS); }
};

const auto no_marker = +[](const char*, int) { return -1; };

TEST(CppSharedBlockAlone, WithoutAServiceThereIsNone) {
    std::error_code error;
    const SharedBlock block(9, 4096, error);
    EXPECT_EQ(error, Errc::failure);
    EXPECT_FALSE(block);
    EXPECT_THROW(SharedBlock(9, 4096), std::system_error);
}

TEST_F(CppSharedBlock, IsOneForAllWhoKnowTheKey) {
    SharedBlock mine(9, 10000);
    const SharedBlock other(9, 10000);
    EXPECT_EQ(mine.size(), 10000U);
    strcpy(static_cast<char*>(mine.data()), "shared");
    EXPECT_STREQ(static_cast<const char*>(other.data()), "shared");
}

TEST_F(CppSharedBlock, GivesItsUseUpOnce) {
    {
        SharedBlock first(9, 4096);
        memset(first.data(), 'x', 4096);
        SharedBlock second(std::move(first));
        EXPECT_FALSE(first);
        EXPECT_EQ(first.data(), nullptr);
        EXPECT_EQ(first.size(), 0U);
        second.close();
        EXPECT_FALSE(second);
        std::error_code error = Errc::failure;
        second.close(error);
        EXPECT_FALSE(error);
        SharedBlock third(10, 4096);
        third = SharedBlock(9, 4096);
    }
    // The last use is gone, so this is a new block.
    const SharedBlock anew(9, 4096);
    EXPECT_EQ(static_cast<const char*>(anew.data())[0], 0);
}

TEST_F(CppSharedBlock, KeysAndSizesTheServiceCannotHandleAreRefused) {
    std::error_code error;
    const SharedBlock no_key(0, 4096, error);
    EXPECT_EQ(error, Errc::invalid_param);
    const SharedBlock large_key(0x80000000U, 4096, error);
    EXPECT_EQ(error, Errc::invalid_param);
    const SharedBlock no_size(9, 0, error);
    EXPECT_EQ(error, Errc::invalid_param);
    constexpr uint64_t kMoreThan32Bits = uint64_t{1} << 32 | 1;
    if constexpr (sizeof(size_t) >= sizeof kMoreThan32Bits) {
        const SharedBlock large_size(9, static_cast<size_t>(kMoreThan32Bits), error);
        EXPECT_EQ(error, Errc::invalid_param);
    }
}

// What could not be acquired was not counted, and must not be taken back.
TEST_F(CppSharedBlock, AFailedOneDoesNotTakeASomebodyElsesUseBack) {
    SharedBlock holder(9, 4096);
    memset(holder.data(), 'x', 4096);
    {
        const PlatformHook hook("libtavoosal.so", "access", no_marker);
        std::error_code error;
        const SharedBlock failed(9, 4096, error);
        EXPECT_EQ(error, Errc::failure);
    }
    const SharedBlock other(9, 4096);
    EXPECT_EQ(static_cast<const char*>(other.data())[0], 'x');
}

TEST_F(CppSharedBlock, AFailedCloseUnmapsAndCanBeTriedAgain) {
    SharedBlock block(9, 4096);
    memset(block.data(), 'x', 4096);
    {
        const PlatformHook hook("libtavoosal.so", "access", no_marker);
        std::error_code error;
        block.close(error);
        EXPECT_EQ(error, Errc::failure);
    }
    EXPECT_FALSE(block);
    EXPECT_EQ(block.data(), nullptr);
    block.close();
    const SharedBlock anew(9, 4096);
    EXPECT_EQ(static_cast<const char*>(anew.data())[0], 0);
}

// The memory would be found by AddressSanitizer.
TEST_F(CppSharedBlock, ADestructorThatCannotReachTheServiceFreesTheHandle) {
    const SharedBlock keeps(9, 4096);
    auto block = std::make_unique<SharedBlock>(9, 4096);
    const PlatformHook hook("libtavoosal.so", "access", no_marker);
    block.reset();
}

TEST_F(CppSharedBlock, WithoutMemoryThereIsNone) {
    const PlatformHook hook(
        "libtavoosal.so", "malloc", +[](size_t) -> void* { return nullptr; });
    std::error_code error;
    const SharedBlock block(9, 4096, error);
    EXPECT_EQ(error, Errc::no_memory);
}

}  // namespace
