// The zones of the classic type word and the two tables that name its
// values: shared by the value operations, the text writer and the reader,
// so that writing and reading can never disagree.
#pragma once

#include <vyr/classic.h>

#include <cstdint>
#include <iterator>
#include <string_view>

namespace vyr::classic {

constexpr uint32_t waivers(uint32_t type) noexcept { return type & MAC_TYPE_WAIVERS; }
constexpr uint32_t mac_class(uint32_t type) noexcept { return type & MAC_TYPE_CLASS; }

struct TypeName {
    uint32_t value;
    std::string_view name;
};

// Whole type words that have a name, searched in this order.
inline constexpr TypeName kTypeNames[] = {
    {MAC_TYPE_SUBJECT, "subject"},
    {MAC_TYPE_OBJECT, "object"},
    {MAC_TYPE_LOW, "low"},
    {MAC_TYPE_EQU, "equ"},
    {MAC_TYPE_EQU_W, "equ_w"},
};

struct LetterSlot {
    uint32_t bit;
    char letter;
};

// The letter form: one position per waiver bit, level waivers on the left,
// category waivers on the right.
inline constexpr LetterSlot kLetterSlots[] = {
    {MAC_WAIVE_LEV_READ, 'r'}, {MAC_WAIVE_LEV_WRITE, 'w'}, {MAC_WAIVE_LEV_EXEC, 'x'},
    {MAC_WAIVE_CAT_READ, 'r'}, {MAC_WAIVE_CAT_WRITE, 'w'}, {MAC_WAIVE_CAT_EXEC, 'x'},
};
inline constexpr size_t kLetterFormLen = std::size(kLetterSlots);

}  // namespace vyr::classic
