// The exported class: names of pools, and handles that share a pool. The memory work is done by
// BucketMgr, whose fast paths are inlined here.

#include <MemPool>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>

#include "MemPool/BucketMgr.hpp"
#include "MemPool/Checked.hpp"
#include "MemPool/MgrRegistry.hpp"
#include "diagnostics/text/Messages.hpp"

namespace OBR::MemPool {

static_assert(sizeof(Mgr) == sizeof(void*), "A handle is one pointer wide.");
static_assert(sizeof(OBR::vector<Mgr*>) == 16, "One pointer and two 32-bit counts.");

namespace {

// Made without a stream, which would write half a name if memory is exhausted.
std::string NextName() {
    static std::uint32_t nameCounter = 1;
    const std::string number = std::to_string(nameCounter++);
    const std::string zeros(5 - std::min<std::size_t>(number.size(), 5), '0');
    return "__OBR_MEMPOOL_" + zeros + number;
}

}  // namespace

// Private, and never called.
Mgr::Mgr(const Mgr&) : bucketMgr(nullptr) {}

Mgr::Mgr(const char* name) : bucketMgr(nullptr) {
    const std::string poolName = name != nullptr ? name : NextName();
    if (registry.Find(poolName) != nullptr) { Messages::DuplicateName(poolName); }
    auto pool = std::make_unique<BucketMgr>(this, poolName);
    registry.Add(poolName, pool.get());
    bucketMgr = pool.release();
}

Mgr::~Mgr() {
    if (OBR_UNLIKELY(!registry.Sharers().empty())) {
        // The other handles of this pool lose it.
        const auto takeFrom = [this](Mgr* other) {
            if (other != this && other->bucketMgr == bucketMgr) { other->bucketMgr = nullptr; }
        };
        if (bucketMgr != nullptr) {
            if (bucketMgr->mgr != nullptr) { takeFrom(bucketMgr->mgr); }
            for (Mgr* const sharer : registry.Sharers()) { takeFrom(sharer); }
        }
        registry.ForgetHandle(this);
    }
    if (bucketMgr == nullptr) { return; }
    Checked::BeforeEnd(*bucketMgr);
    registry.Erase(bucketMgr->name);
    delete bucketMgr;
    bucketMgr = nullptr;
}

Mgr& Mgr::operator=(const Mgr& other) {
    if (bucketMgr != other.bucketMgr) {
        registry.AddSharer(this);
        bucketMgr = other.bucketMgr;
    }
    return *this;
}

void* Mgr::Alloc(unsigned int size) {
    const Checked::Use use(*bucketMgr);
    return Checked::Taken(*bucketMgr, bucketMgr->Alloc(size), size);
}

bool Mgr::Free(void* data) {
    const Checked::Use use(*bucketMgr);
    return Checked::MayRelease(*bucketMgr, data) && bucketMgr->Free(data);
}

void Mgr::Clear() {
    const Checked::Use use(*bucketMgr);
    Checked::BeforeClear(*bucketMgr);
    bucketMgr->Clear();
}

bool Mgr::CollectGarbage() {
    return false;
}

bool Mgr::Contains(const void* data) const {
    const Checked::Use use(*bucketMgr);
    return Checked::MayAskAbout(*bucketMgr, data) && bucketMgr->Contains(data);
}

unsigned int Mgr::GetSize(const void* data) const {
    const Checked::Use use(*bucketMgr);
    return Checked::MayAskAbout(*bucketMgr, data) ? bucketMgr->GetSize(data) : 0;
}

BucketMgr* Mgr::GetBucketMgr() const {
    return bucketMgr;
}

const char* Mgr::GetName() const {
    return bucketMgr->name.c_str();
}

bool Mgr::IsEnabled() const {
    return bucketMgr->enabled;
}

}  // namespace OBR::MemPool
