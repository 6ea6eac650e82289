#include "common/KeptTexts.h"

#include <bit>
#include <cstring>

namespace halyard {
namespace {

// Half of them stay empty, so that looking ends soon.
constexpr std::size_t kSlots = 2 * KeptTexts::kMostTexts;
static_assert(std::has_single_bit(kSlots));
constexpr std::size_t kKeptBytes = std::size_t{64} * 1024;

} // namespace

// Where it is, or would be.
std::size_t KeptTexts::slotOf(const void* of) const noexcept {
    constexpr unsigned kShift = 64 - std::countr_zero(kSlots);
    const std::uint64_t hash = reinterpret_cast<std::uintptr_t>(of) * 0x9E3779B97F4A7C15U;
    std::size_t slot = hash >> kShift;
    while (slots_[slot].round == round_ && slots_[slot].of != of) {
        slot = (slot + 1) % kSlots;
    }
    return slot;
}

std::string_view KeptTexts::find(const void* of) const noexcept {
    if (count_ == 0) {
        return {};
    }
    const Slot& slot = slots_[slotOf(of)];
    if (slot.round != round_) {
        return {};
    }
    const char* const at = texts_.data() + slot.at;
    std::uint32_t length = 0;
    std::memcpy(&length, at, sizeof length);
    return {at + sizeof length, length};
}

void KeptTexts::keep(const void* of, std::string_view text) {
    const auto length = static_cast<std::uint32_t>(text.size());
    const std::size_t at = texts_.size();
    if (count_ == kMostTexts || at + sizeof length + text.size() > kMostBytes) {
        return;
    }
    slots_.resize(kSlots);
    slots_[slotOf(of)] = {of, static_cast<std::uint32_t>(at), round_};
    texts_.resize(at + sizeof length + text.size());
    std::memcpy(texts_.data() + at, &length, sizeof length);
    std::memcpy(texts_.data() + at + sizeof length, text.data(), text.size());
    ++count_;
}

void KeptTexts::forget() {
    const bool isRoomy = texts_.capacity() > kKeptBytes && texts_.size() <= kKeptBytes;
    texts_.clear();
    if (isRoomy) {
        texts_.shrink_to_fit();
    }
    count_ = 0;
    if (++round_ == 0) {
        slots_.clear();
        round_ = 1;
    }
}

} // namespace halyard
