#include <gtest/gtest.h>

#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "ko/os.hpp"

#if defined(__GLIBC__)
#include <malloc.h>
#endif

namespace {

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr bool kOwnAllocator = true;
#elif defined(__has_feature)
#if __has_feature(address_sanitizer) || __has_feature(thread_sanitizer)
constexpr bool kOwnAllocator = true;
#else
constexpr bool kOwnAllocator = false;
#endif
#else
constexpr bool kOwnAllocator = false;
#endif

// Allocates `total` bytes in blocks of `block`, writes them and frees them all.
void churn(std::size_t total, std::size_t block) {
  std::vector<void*> blocks;
  for (std::size_t done = 0; done < total; done += block) {
    void* p = std::malloc(block);
    ASSERT_NE(p, nullptr);
    std::memset(p, 0x5a, block);
    blocks.push_back(p);
  }
  for (void* p : blocks) {
    std::free(p);
  }
}

// With the setting, memory freed after a large free stays with the process, and a
// block of a few megabytes comes from the heap instead of a mapping of its own.
TEST(KeepFreedMemory, FreedMemoryStaysWithTheProcess) {
#if defined(__GLIBC__)
  if (kOwnAllocator) {
    GTEST_SKIP() << "the sanitizers bring an allocator of their own";
  }
  ASSERT_TRUE(ko::os::keepFreedMemory(std::size_t{64} << 20));
  constexpr std::size_t kTotal = std::size_t{8} << 20;
  churn(kTotal, 256);
  // A large free is what makes the allocator consider giving its top back.
  churn(std::size_t{1} << 20, std::size_t{1} << 20);
  const struct mallinfo2 afterFree = ::mallinfo2();
  EXPECT_GE(afterFree.fordblks, kTotal);

  void* big = std::malloc(std::size_t{4} << 20);
  ASSERT_NE(big, nullptr);
  EXPECT_EQ(::mallinfo2().hblkhd, afterFree.hblkhd);
  std::free(big);
#else
  GTEST_SKIP() << "no allocator settings on this C library";
#endif
}

}  // namespace
