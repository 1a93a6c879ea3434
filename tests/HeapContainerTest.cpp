// Standard containers and shared pointers in heaps, through Allocator and through Resource.

#include <MemPoolHeap>

#include <deque>
#include <list>
#include <map>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "PoolFixture.hpp"

namespace OBR::MemPool {

namespace {

struct alignas(64) Wide {
    explicit Wide(int n) : number(n) {}
    bool operator==(const Wide& other) const { return number == other.number; }
    int number;
};

struct Home {
    Heap heap;
    Resource resource{heap};
    std::size_t NumBlocks() const {
        return heap.GetStats().usedRecords + heap.GetStats().heapRecords;
    }
    template <typename Alloc>
    Alloc Get() {
        if constexpr (std::is_constructible_v<Alloc, Heap&>) {
            return heap;
        } else {
            return &resource;
        }
    }
};

template <typename Container>
class HeapContainerTest : public PoolFixture {};

template <typename T>
using Of = Allocator<T>;
using OfPair = Allocator<std::pair<const long, Wide>>;
using Containers =
    testing::Types<std::vector<Wide, Of<Wide>>, std::pmr::vector<double>,
                   std::deque<long, Of<long>>, std::pmr::deque<Wide>, std::list<Wide, Of<Wide>>,
                   std::pmr::list<char>, std::basic_string<char, std::char_traits<char>, Of<char>>,
                   std::pmr::string, std::map<long, Wide, std::less<long>, OfPair>,
                   std::pmr::map<long, double>,
                   std::unordered_map<long, Wide, std::hash<long>, std::equal_to<long>, OfPair>,
                   std::pmr::unordered_map<int, Wide>>;
TYPED_TEST_SUITE(HeapContainerTest, Containers, );

}  // namespace

TYPED_TEST(HeapContainerTest, IsCopiedMovedAndSwappedBetweenHeaps) {
    using Alloc = typename TypeParam::allocator_type;
    constexpr bool isClassic = std::allocator_traits<Alloc>::propagate_on_container_swap::value;
    using T = typename TypeParam::value_type;
    const auto build = [](Home& home, int size) {
        TypeParam container(home.Get<Alloc>());
        while (size-- != 0) {
            auto at = container.end();
            if constexpr (std::is_constructible_v<T, int, int>) {
                at = container.insert(at, T(size, size));
            } else {
                at = container.insert(at, static_cast<T>(size));
            }
            EXPECT_EQ(reinterpret_cast<std::uintptr_t>(&*at) % alignof(T), 0);
        }
        return container;
    };
    for (const bool off : {false, true}) {
        Settings::off = off;
        Home first;
        Home second;
        {
            const TypeParam large = build(first, 300);
            const TypeParam copy(large);
            EXPECT_EQ(copy.get_allocator() == large.get_allocator(), isClassic);
            TypeParam assigned = build(second, 10);
            assigned = copy;
            EXPECT_TRUE(assigned.get_allocator() == second.Get<Alloc>());
            TypeParam moved = build(first, 10);
            moved = std::move(assigned);
            EXPECT_EQ(moved.get_allocator() == second.Get<Alloc>(), isClassic);
            if constexpr (isClassic) {
                TypeParam swapped = build(first, 10);
                swap(swapped, moved);
                EXPECT_TRUE(moved == build(second, 10));
                swap(swapped, moved);
            }
            EXPECT_TRUE(copy == large && moved == large);
        }
        EXPECT_EQ(first.NumBlocks() + second.NumBlocks(), 0);
        for (std::size_t n = 0; HeapSpy::FailsAt(n, [&] { build(first, 50); }); ++n) {
            EXPECT_EQ(first.NumBlocks(), 0);
        }
    }
}

TEST(HeapPointerTest, SharesAndNests) {
    struct Node {
        explicit Node(Heap& heap) : children(heap) {}
        std::vector<Node, Allocator<Node>> children;
    };
    Home first;
    Home second;
    {
        const auto wide = std::allocate_shared<Wide>(Allocator<void>(first.heap), 1);
        const auto other =
            std::allocate_shared<Wide>(std::pmr::polymorphic_allocator<Wide>(&first.resource), 1);
        EXPECT_TRUE(*wide == *other);
        EXPECT_TRUE(*New<Wide>(second.heap, 1) == *wide);
        struct Throws {
            Throws() { throw 1; }
        };
        EXPECT_ANY_THROW(New<Throws>(second.heap));
        Node tree(first.heap);
        tree.children.emplace_back(first.heap);
        EXPECT_EQ(first.NumBlocks(), 3);
    }
    EXPECT_EQ(first.NumBlocks() + second.NumBlocks(), 0);
    EXPECT_EQ(first.resource, Resource(first.heap));
    EXPECT_NE(first.resource, second.resource);
    EXPECT_NE(first.resource, *std::pmr::new_delete_resource());
    EXPECT_NE(Allocator<int>(first.heap), Allocator<long>(second.heap));
}

}  // namespace OBR::MemPool
