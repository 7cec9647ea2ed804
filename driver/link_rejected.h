// SPDX-License-Identifier: BSD-2-Clause
#pragma once

// Thrown when the target of a link is rejected: a bare `int`, as for a failed
// call, but not an error number. No handler looks at it.
inline constexpr int link_rejected = -1;
