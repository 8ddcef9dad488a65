// The registered components and the level bytes that they test.
#ifndef QZ_TR_REGISTRY_H
#define QZ_TR_REGISTRY_H

#include "qz/tr.h"

#include <cstdint>
#include <span>
#include <string_view>

namespace qz::tr::registry {

// Registers a component, or registers it again, and sets its levels, one per category. Returns TR_OK, TR_BAD_PARAMETER
// (invalid name) or TR_NO_MEMORY (table full).
int add(std::string_view name, std::span<std::uint8_t> levels, std::span<const tr_category_t> categories);

// Sets the component's levels to 0 and forgets them. Returns TR_OK or TR_NOT_REGISTERED.
int remove(std::string_view name);

bool contains(std::string_view name);

} // namespace qz::tr::registry

#endif
