# SPDX-License-Identifier: BSD-2-Clause
"""What must happen in a boot: the `model` says how, the `properties` say what, and a
`trial` compares both with what is seen, perhaps under one of the `conditions`."""
