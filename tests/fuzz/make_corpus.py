#!/usr/bin/env python3
"""Writes the hand-made part of the corpora of the property list, JSON and base64 targets into corpus/."""
import pathlib
import struct

HERE = pathlib.Path(__file__).resolve().parent / "corpus"


def save(target, inputs):
    folder = HERE / target
    folder.mkdir(parents=True, exist_ok=True)
    for name, content in inputs.items():
        (folder / name).write_bytes(content if isinstance(content, bytes) else content.encode())


def binary(objects, offset_size=1, reference_size=1, count=None, top=0, table=None):
    body, offsets = b"bplist00", b""
    for item in objects:
        offsets += len(body).to_bytes(offset_size, "big")
        body += item
    return (body + offsets + bytes(6) + bytes([offset_size, reference_size]) +
            struct.pack(">QQQ", len(objects) if count is None else count, top, len(body) if table is None else table))


def main():
    scalars = {
        "true": b"\x09", "integer1": b"\x10\xff", "integer8": b"\x13" + b"\xff" * 8,
        "integer16": b"\x14" + bytes(8) + b"\xff" * 8, "real4": b"\x22\x3f\xc0\0\0", "real8": b"\x23\xbf\xf8" + bytes(6),
        "date": b"\x33" + bytes(8), "data": b"\x42\0\xff", "ascii": b"\x53abc",
        "long": b"\x5f\x10\x14" + b"x" * 20, "utf16": b"\x63\xd8\x3d\xde\0\0A", "surrogate": b"\x61\xde\0",
        "identifier": b"\x81\1\2", "null": b"\0",
    }
    lists = {name: binary([item]) for name, item in scalars.items()}
    lists.update({
        "dictionary": binary([b"\xd2\1\2\3\4", b"\x51a", b"\x51b", b"\xa2\1\5", b"\0", b"\x09"]),
        "wide": binary([b"\xc2\0\0\0\1\0\0\0\1", b"\xa0"], offset_size=8, reference_size=4),
        "cycle": binary([b"\xa1\1", b"\xa1\0"]),
        "laughs": binary([b"\xae" + bytes([i + 1]) * 14 for i in range(14)] + [b"\x08"]),
        "count": binary([b"\xdf\x13" + b"\xff" * 8]),
        "trailer": binary([b"\x09"], count=1 << 61),
    })
    save("property_list_binary", lists)

    every = ("<dict><key>a</key><array><string>x &amp; <![CDATA[<y>]]></string><integer>-0x1F</integer>"
             "<integer>18446744073709551615</integer><real>1.5e-3</real><real>-inf</real><true/><false/>"
             "<date>2024-02-29T12:00:01Z</date><data> AAEC\n</data><dict/></array></dict>")
    whole = f'<?xml version="1.0" encoding="UTF-8"?>\n<!-- c --><plist version="1.0">{every}</plist>\n'
    save("property_list_xml", {
        "every": whole,
        "utf16": b"\xff\xfe" + "<plist><string>\u2603</string></plist>".encode("utf-16-le"),
        "doctype": '<!DOCTYPE plist SYSTEM "x.dtd"><plist><true/></plist>',
        "entity": '<!DOCTYPE plist [<!ENTITY a "b">]><plist><string>&a;</string></plist>',
        "external": '<!DOCTYPE plist SYSTEM "x.dtd"><plist><string>&a;</string></plist>',
        "deep": "<plist>" + "<array>" * 70,
        "nan": "<plist><real>nan</real></plist>",
        "return": "<plist><string>&#13;\r\n&#x10FFFF;</string></plist>",
    })
    save("json", {
        "every": '{"a":[1,-2,18446744073709551615,1.5e-3,1e300,true,false,"\\u00e9\\ud83d\\ude00\\n"],"n":null}',
        "date": '{"d":{"$date":1.5},"b":{"$data":"AAEC"},"x":{"$date":"no"}}',
        "big": "123456789012345678901234567890", "deep": "[" * 70, "empty": "", "spaces": " [ ] ", "zero": "-0.0",
    })
    save("base64", {
        "whole": "Zm9vYmFy", "one": "Zg==", "two": "Zm8=", "lines": "Zm9v\r\nYm Fy\n", "short": "Zg=", "inside": "Zg==Zg==",
        "bytes": bytes(range(256)),
    })


main()
