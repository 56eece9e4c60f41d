# SPDX-License-Identifier: Apache-2.0
HEADINGS = []
def rows(found): return []
def measure(place, given): return []
