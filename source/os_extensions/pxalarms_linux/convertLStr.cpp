// convertLStr.cpp - host string conversions.
#include "convertLStr.h"

#include <cstring>

#include "pxAssert.h"

namespace pxalarms {

namespace {
// Room for the 4-byte count plus slack the host's allocator expects.
constexpr size_t kHandleOverhead = 7;
}  // namespace

LStr* StringToLStr(LStr*** dst, const std::string& src)
{
    PX_ASSERT(dst);
    const size_t n = src.size();
    if (*dst == nullptr) {
        UHandle fresh = DSNewHandle(n + kHandleOverhead);
        if (fresh == nullptr)
            return nullptr;
        *dst = reinterpret_cast<LStr**>(fresh);
    } else if (DSSetHandleSize(reinterpret_cast<UHandle>(*dst), n + kHandleOverhead) != 0) {
        return nullptr;
    }
    LStr* block = **dst;
    std::memcpy(block->str, src.data(), n);
    block->cnt = static_cast<int32_t>(n);
    return block;
}

std::string LStrToString(LStr** handle)
{
    if (handle == nullptr || *handle == nullptr)
        return std::string();
    const LStr* block = *handle;
    const int32_t count = block->cnt > 0 ? block->cnt : 0;
    return std::string(reinterpret_cast<const char*>(block->str), static_cast<size_t>(count));
}

}  // namespace pxalarms
