// convertLStr.h - conversions between host string handles and std::string.
//
// StringToLStr writes through the host's handle functions, so the host may
// move the block; the count it writes excludes any terminator.
#pragma once

#include <string>

#include "pxalarms.h"

namespace pxalarms {

// Creates or resizes the handle at *dst and copies src into it.  Returns the
// block, or null when the host could not provide the memory (the handle is
// then as it was).
LStr* StringToLStr(LStr*** dst, const std::string& src);

// The counted bytes of the handle's text; empty for a null handle or block.
std::string LStrToString(LStr** handle);

}  // namespace pxalarms
