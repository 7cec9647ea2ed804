// SPDX-License-Identifier: BSD-2-Clause
#pragma once

// What is thrown when the target of a link is rejected: a bare `int`, as for a
// call that failed, and no error number. No handler looks at it.
inline constexpr int link_rejected = -1;
