"""The other side of the property list tests: Python's plistlib.

    plist_oracle.py write xml|binary FILE    writes the sample
    plist_oracle.py compare FILE             exit status 0 when FILE holds the sample
"""
import datetime
import plistlib
import sys

SAMPLE = {
    "texts": ["", "plain", "<&>\"' \n\t", "äöü → 🎉", "x" * 300],
    "integers": [0, 1, 127, 128, 255, 256, 65535, 65536, 2**31, 2**32, 2**63 - 1, 2**63, 2**64 - 1,
                 -1, -128, -129, -2**31 - 1, -2**63],
    "reals": [0.0, -1.5, 0.1, 1e300, 5e-324, float("inf"), float("-inf")],
    "booleans": [True, False],
    "dates": [datetime.datetime(1970, 1, 1), datetime.datetime(2026, 11, 24, 20, 31, 29),
              datetime.datetime(1900, 2, 28, 23, 59, 59), datetime.datetime(9999, 12, 31, 23, 59, 59)],
    "data": [b"", b"\x00\x01\xff", bytes(range(256)) * 3],
    "empty": [[], {}],
    "shared": ["same", "same", {"same": "same"}],
    "ключ": {"deep": [[[[{"er": "!"}]]]]},
    "many": {f"key {i}": i for i in range(300)},
}

if sys.argv[1] == "write":
    form = plistlib.FMT_XML if sys.argv[2] == "xml" else plistlib.FMT_BINARY
    with open(sys.argv[3], "wb") as file:
        plistlib.dump(SAMPLE, file, fmt=form, sort_keys=False)
else:
    with open(sys.argv[2], "rb") as file:
        read = plistlib.load(file)
    # Booleans equal numbers in Python; their text tells them apart. It tells the order of keys as well.
    if repr(read) != repr(SAMPLE):
        sys.exit(f"differs: {read!r}")
