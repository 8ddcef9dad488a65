// The difference of two texts in the unified form, as patch takes it.
#ifndef QZACL_UNIFIED_DIFF_H
#define QZACL_UNIFIED_DIFF_H

#include <string>
#include <string_view>

namespace qzacl {

// One hunk, from the first line that differs to the last, with up to three lines of context. Empty for equal texts.
std::string unified_diff(std::string_view before, std::string_view after, const std::string &name);

} // namespace qzacl

#endif
