// The compact vector: its growth, its limit of 32 bits, and what it holds after a failure.

#include <MemPool>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <new>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace {

// An allocator that writes down what it is asked for and can refuse it.
std::vector<std::size_t> requests;
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
        for (std::size_t i = 0; i < n; ++i) { block[i] = -1; }
        std::allocator<T>().deallocate(block, n);
    }
};

using Vector = OBR::vector<int, Notebook<int>>;
using Counts = std::vector<std::size_t>;

static_assert(offsetof(Vector, data) == 0 && offsetof(Vector, size) == 8 &&
                  offsetof(Vector, capacity) == 12 && sizeof(Vector) == 16,
              "One pointer and two 32-bit counts.");

class VectorTest : public testing::Test {
protected:
    VectorTest() {
        requests.clear();
        elementsOut = 0;
        refuses = false;
    }
    ~VectorTest() override { EXPECT_EQ(elementsOut, 0u) << "A block goes back with its count."; }
};

// The text of the failure, if it is one of memory.
template <typename Action>
std::string Failure(Action action) {
    try {
        action();
    } catch (const std::bad_alloc& failure) { return failure.what(); }
    return "none";
}

}  // namespace

TEST_F(VectorTest, GrowsByDoublingAndTakesItsOwnElements) {
    Vector numbers;
    EXPECT_EQ(numbers.data, nullptr);
    numbers.push_back(7);
    Counts capacities{numbers.capacity};
    for (std::uint32_t size = 2; size <= 9; ++size) {
        numbers.push_back(numbers[0]);
        capacities.push_back(numbers.capacity);
        EXPECT_EQ(numbers.size, size);
        EXPECT_EQ(numbers[size - 1], 7);
    }
    EXPECT_EQ(capacities, (Counts{1, 2, 4, 4, 8, 8, 8, 8, 16}));
    EXPECT_EQ(requests, (Counts{1, 2, 4, 8, 16}));
}

TEST_F(VectorTest, ReservesExactlyAndNeverShrinks) {
    Vector numbers;
    numbers.reserve(0);
    EXPECT_EQ(numbers.data, nullptr);
    numbers.reserve(3);
    for (int i = 0; i < 3; ++i) { numbers.push_back(i); }
    numbers.reserve(2);
    numbers.reserve(3);
    EXPECT_EQ(requests, Counts{3});
    EXPECT_EQ(numbers.capacity, 3u);
    numbers.push_back(3);
    EXPECT_EQ(numbers.capacity, 6u);
    EXPECT_EQ(requests, (Counts{3, 6}));
}

TEST_F(VectorTest, KeepsEveryElementInItsPlaceWhenItMoves) {
    for (int count = 0; count < 8; ++count) {
        Vector numbers;
        std::vector<int> expected;
        for (int i = 0; i < count; ++i) {
            numbers.push_back(i);
            expected.push_back(i);
        }
        numbers.reserve(9);
        EXPECT_EQ(std::vector<int>(numbers.begin(), numbers.end()), expected);
        if (count > 0) { EXPECT_EQ(numbers[numbers.size - 1], count - 1); }
    }
}

TEST_F(VectorTest, StaysAsItWasIfTheAllocatorRefuses) {
    Vector numbers;
    numbers.push_back(1);
    numbers.push_back(2);
    int* const data = numbers.data;
    refuses = true;
    EXPECT_EQ(Failure([&] { numbers.reserve(100); }), std::bad_alloc().what());
    EXPECT_EQ(Failure([&] { numbers.push_back(3); }), std::bad_alloc().what());
    EXPECT_EQ(requests, (Counts{1, 2, 100, 4}));
    EXPECT_EQ(numbers.data, data);
    EXPECT_EQ(numbers.size, 2u);
    EXPECT_EQ(numbers.capacity, 2u);
    EXPECT_EQ(data[0] + data[1], 3);
}

// Beyond the limit the allocator is not even asked; up to it, it is.
TEST_F(VectorTest, HoldsNoMoreThan32BitsCanCount) {
    constexpr std::size_t limit = 0xFFFFFFFF;
    refuses = true;
    Vector numbers;
    for (const std::size_t n : {limit + 1, limit * limit, std::size_t{0} - 1}) {
        EXPECT_EQ(Failure([&] { numbers.reserve(n); }), "bad allocation");
    }
    // As full as no test can fill it: the block is never looked at.
    for (const std::uint32_t full : {0x80000000, 0xFFFFFFFF}) {
        numbers.size = numbers.capacity = full;
        EXPECT_EQ(Failure([&] { numbers.push_back(1); }), "bad allocation");
        EXPECT_EQ(numbers.size, full);
        EXPECT_EQ(numbers.capacity, full);
    }
    EXPECT_EQ(requests, Counts());
    EXPECT_EQ(numbers.data, nullptr);

    numbers.size = numbers.capacity = 0x7FFFFFFF;
    EXPECT_EQ(Failure([&] { numbers.push_back(1); }), std::bad_alloc().what());
    EXPECT_EQ(Failure([&] { numbers.reserve(limit); }), std::bad_alloc().what());
    EXPECT_EQ(requests, (Counts{limit - 1, limit}));
}
