# SPDX-License-Identifier: Apache-2.0
"""Shared parts of drawings: a style for light and dark pages that is readable on a phone, and texts."""

STYLE = """text { font: 14px system-ui, sans-serif; fill: #222 } .title { font-size: 16px; font-weight: 600 }
.small { font-size: 12px } .grid { stroke: #d8dbe0 } .back { fill: #fff }
@media (prefers-color-scheme: dark) { text { fill: #e6e6e6 } .grid { stroke: #3a3f47 } .back { fill: #16191d } }"""


def text(x, y, words, kind="", anchor="start"):
    return f'<text class="{kind}" x="{x:.1f}" y="{y:.1f}" text-anchor="{anchor}">{words}</text>'
