# SPDX-License-Identifier: BSD-2-Clause
"""Everything that boots the program many times and judges it, in floors; each imports
only from those above it in this list.

`words` describe a device and what is seen of it, `carriers` make one real and boot it,
`oracles` say what must happen. On these stand `arm64_device` and `debian_systems`,
which boot in an emulator, `demo` and `readers`, `bench`, the `proofs`, a file for each
claim, and at the bottom the `doors` that scripts/ opens.
"""
