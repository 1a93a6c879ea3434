// The compact vector: its growth, its limit of 32 bits, and its contents after a failure.

#include <MemPool>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <new>
#include <string>
#include <type_traits>
#include <vector>

#include <gtest/gtest.h>

namespace {

using Counts = std::vector<std::size_t>;

// An allocator that records its requests and can refuse them.
Counts requests;
std::size_t elementsOut;
bool refuses;

template <typename T>
struct Notebook {
    using value_type = T;
    T* allocate(std::size_t n) {
        requests.push_back(n);
        if (refuses) { throw std::bad_alloc(); }
        elementsOut += n;
        return std::allocator<T>().allocate(n);
    }
    void deallocate(T* block, std::size_t n) {
        elementsOut -= n;
        std::fill_n(block, n, -1);
        std::allocator<T>().deallocate(block, n);
    }
};

using Vector = OBR::vector<int, Notebook<int>>;

static_assert(offsetof(Vector, data) == 0 && offsetof(Vector, size) == 8 &&
                  offsetof(Vector, capacity) == 12 && sizeof(Vector) == 16,
              "One pointer and two 32-bit counts.");
static_assert(!std::is_copy_constructible<Vector>::value && !std::is_copy_assignable<Vector>::value,
              "Two vectors would release one block.");

class VectorTest : public testing::Test {
protected:
    VectorTest() {
        requests.clear();
        refuses = false;
    }
    ~VectorTest() override {
        EXPECT_EQ(elementsOut, 0u) << "A block must be released with its count.";
    }
};

// The text of the std::bad_alloc that the action throws.
template <typename Action>
std::string Failure(Action action) {
    try {
        action();
    } catch (const std::bad_alloc& failure) { return failure.what(); }
    return "none";
}

}  // namespace

TEST_F(VectorTest, GrowsByDoublingAndKeepsEveryElement) {
    Vector numbers;
    EXPECT_EQ(numbers.data, nullptr);
    std::vector<int> expected;
    for (int i = 0; i < 9; ++i) {
        numbers.push_back(i);
        expected.push_back(i);
        EXPECT_EQ(std::vector<int>(numbers.begin(), numbers.end()), expected);
        const Vector& view = numbers;
        EXPECT_EQ(std::vector<int>(view.begin(), view.end()), expected);
        EXPECT_EQ(numbers[0] + view[view.size - 1], i);
    }
    EXPECT_EQ(requests, (Counts{1, 2, 4, 8, 16}));
    EXPECT_EQ(numbers.capacity, 16u);
    while (numbers.size < 17) { numbers.push_back(numbers[8]); }
    EXPECT_EQ(numbers[16], 8) << "The argument is an element that is moved.";
}

TEST_F(VectorTest, ReservesExactlyAndNeverShrinks) {
    Vector numbers;
    numbers.reserve(0);
    EXPECT_EQ(numbers.data, nullptr);
    for (const std::size_t n : {3U, 2U, 3U, 8U}) { numbers.reserve(n); }
    EXPECT_EQ(requests, (Counts{3, 8}));
    EXPECT_EQ(numbers.capacity, 8u);
}

// Up to the limit the allocator is asked, and refuses; above it, it is not asked.
TEST_F(VectorTest, StaysAsItWasIfItCannotGrow) {
    constexpr std::size_t limit = 0xFFFFFFFF;
    const std::string refusal = std::bad_alloc().what();
    Vector numbers;
    numbers.push_back(1);
    int* const data = numbers.data;
    refuses = true;
    EXPECT_EQ(Failure([&] { numbers.reserve(limit); }), refusal);
    EXPECT_EQ(Failure([&] { numbers.reserve(limit + 1); }), "bad allocation");
    // A vector as full as no test can fill it: its block is never read.
    for (const std::uint32_t full : {0x80000000u, 0x7FFFFFFFu, 1u}) {
        numbers.size = numbers.capacity = full;
        EXPECT_EQ(Failure([&] { numbers.push_back(2); }),
                  full == 0x80000000 ? "bad allocation" : refusal);
        EXPECT_EQ(numbers.data, data);
        EXPECT_EQ(numbers.size, full);
        EXPECT_EQ(numbers.capacity, full);
    }
    EXPECT_EQ(requests, (Counts{1, limit, limit - 1, 2}));
}
