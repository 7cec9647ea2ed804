# SPDX-License-Identifier: BSD-2-Clause
"""The demonstration: eight boots of one device with real time-zone data. `story`
tells and checks the boots, `screen` prints, `picture` draws."""
