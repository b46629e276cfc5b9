#pragma once

#include "kstctl/Report.h"
#include "kstctl/decode/Decoded.h"

namespace kstctl::decode {

/// Adds the fields of a state record. `blob` holds at least as many bytes as one has.
void addStateFields(Report& report, Bytes blob);

/// Adds the fields of an analytics record, or its bytes when their layout is not known. `blob`
/// holds at least as many bytes as one has.
void addAnalyticsFields(Report& report, Bytes blob);

} // namespace kstctl::decode
