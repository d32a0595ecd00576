#!/usr/bin/python3
"""Makes the seed corpora and dictionaries of the fuzz programs.

    make_seeds.py DIRECTORY

Fills DIRECTORY/TARGET with the seeds and DIRECTORY/TARGET.dict with the words of each target.
"""

import pathlib
import sqlite3
import struct
import sys
import tempfile

SEPARATOR = b"\xff\x1f"  # between the fields of an input

# What strangers write on their disks.
HOSTILE = [
    b"plain", b"", b" ", b"My Disk", b'quo"te', b'"', b'\\"', b"it's", b"';--", b"'); drop table disk;--",
    b"UUID=", b'UUID="0000-0000"', b"TYPE=", b'TYPE="ext4"', b'" TYPE="ntfs" X="', b"LABEL=", b"PARTLABEL=\"x",
    b"%s%s%s%n", b"%", b"%d%999999d", b"a\nb", b"\n", b"a\r\nb", b"a\tb", b"a\0b", b"\0",
    b"\xff\xfe", b"\xc3\x28", b"\xed\xa0\x80", b"\xf0\x9f\x92\xbe", "\u00fc\u00e4\u00f6".encode(), b"\x7f\x1b[2J",
    b"$(reboot)", b"`reboot`", b";reboot;", b"|reboot", b"&& reboot", b"> /etc/passwd", b"*?[a-z]{1,2}~#!",
    b"../../etc", b"/tmp/mountd/../etc", b"-rf", b"a-b-c-d", b"x" * 127, b"x" * 128, b"x" * 4096,
    b'"' * 64 + b"\\" * 64, bytes(range(1, 256)),
]

MOUNT_PATHS = [
    b"/tmp/mountd/disk1_part1", b"/tmp/mountd/disk12_part3", b"/tmp/mountd/disk1_part1/sub", b"/tmp/mountd",
    b"/tmp/mountd/", b"/tmp/mountd/.", b"/tmp/mountd/..", b"/tmp/mountd/../x",
    b"/tmp/mountd/a;reboot", b"/tmp/mountd/$(reboot)",
    b"/tmp/mountd/a b", b"/tmp/mountd/a\nb", b"/tmp/mountdx", b"/etc", b"", b"/tmp/mountd/usbdisk",
    b"/tmp/mountd/disk99999999999999999999_part4294967296", b"/tmp/mountd/" + b"y" * 120, b"/tmp/mountd/_1_2",
]

SECTOR = 512


def joined(*fields):
    return SEPARATOR.join(fields)


def event_stream():
    yield b"#add:sda1\n"
    yield b"#add:sda;#add:mmcblk0p1\r#remove_dev:sda\0"
    yield b"#add:sda1\n#remove_disk:disk1_part1\n#remove_dev:sda1\n#safe_remove\n"
    yield joined(b"#add:sda\n#heart_beat\n", b"#safe_remove\n", b"#remove_disk:disk0_part1\n")
    yield joined(b"#addition:sda1\n#remove_device:sda1;#heart_beats\n", b"half", b"#remove_dev\n")
    yield b"#add:" + b"n" * 31 + b"\n#add:" + b"n" * 32 + b"\n#add:" + b"n" * 32 + b";"
    for size in (253, 254, 255, 256, 257):
        yield b"#add:sda1" + b"z" * (size - 9) + b"\n#heart_beat\n"
    for text in HOSTILE:
        yield b"#add:" + text + b"\n#remove_dev:" + text + b";#remove_disk:" + text + b"\n" + text + b"\n"


def mount_listing():
    lines = [b"/dev/sd%c1 on %s type ext4 (rw)\n" % (0x61 + i % 26, path) for i, path in enumerate(MOUNT_PATHS)]
    yield b"".join(lines)
    yield b"".join(lines[:1] * 20)
    yield b"/dev/mmcblk0p1 on /tmp/mountd/disk2_part1 type vfat (rw)\n/dev/mmcblk1p1 on /tmp/mountd/x type vfat\n"
    yield b"".join(b"/dev/sda%d on /tmp/mountd/disk%d_part%d type ext4\n" % (i, i, i) for i in range(1, 18))
    yield b"proc on /proc type proc (rw)\ntmpfs on /tmp/mountd type tmpfs (rw)\n/dev/sda1 on /mnt type ext4\n"
    for text in MOUNT_PATHS + HOSTILE:
        yield b"/dev/sda1 on " + text + b" type ext4 (rw)\n"
        yield b"/dev/sda" + text + b" on /tmp/mountd/disk3_part" + text + b" type ext4 (rw)\n"
        yield b"/dev/sda1 on /tmp/mountd/" + text + b" type ext4 (rw)\n" * 2


def blkid_output():
    line = b'/dev/sda1: LABEL="%s" UUID="%s" BLOCK_SIZE="512" TYPE="%s" PARTLABEL="%s" PARTUUID="00-01"\n'
    for kind in (b"ext2", b"ext3", b"ext4dev", b"vfat", b"ntfs3", b"exfat", b"hfsplus", b"x" * 20):
        yield line % (b"a label", b"1234-ABCD", kind, b"p")
    yield b'/dev/sda1: SEC_TYPE="msdos" LABEL="A-B-C-D" UUID="1" TYPE="vfat"\n'
    yield b'/dev/sda1: PTUUID="1" PTTYPE="dos"\n'
    yield b"/dev/sda1: TYPE="
    yield b'/dev/sda1: UUID="'
    for text in HOSTILE:
        for padding in range(8):  # the size chooses the reader
            yield line % (text, text, b"ext4", text) + b" " * padding
        yield joined(line % (text, b"1", b"vfat", b""), line % (text, text, text, text), b"")


def label_script():
    for text in HOSTILE:
        yield text
        yield text + b"\n"
        yield text + b"\nsecond line\n" + text


def pid_file():
    yield joined(b"123", b"99\n123\n")
    yield joined(b"12", b"4123\n")
    yield joined(b"", b"1\n")
    yield joined(b"-", b"1\n2\n")
    yield joined(b"1" * 32 + b"2", b"1" * 33)
    yield joined(b"77", b"1" * 126 + b"77")
    yield joined(b"77", b"1" * 127 + b"77")
    for text in HOSTILE:
        yield joined(text, b"1\n" + text + b"\n2\n")
        yield joined(text, b"")


def image(size, *pieces, answer=2):
    """A device of that size: pieces are pairs of offset and bytes."""
    packed = struct.pack("<HB", size, answer)
    for offset, content in pieces:
        for at in range(0, len(content), 255):
            part = content[at:at + 255]
            packed += struct.pack("<HB", offset + at, len(part)) + part
    return packed


def ext_superblock(compatible, incompatible, read_only):
    return [(1024 + 0x38, b"\x53\xef"), (1024 + 0x5C, struct.pack("<III", compatible, incompatible, read_only))]


def device_image():
    signature = (510, b"\x55\xaa")
    boot_sectors = [
        [(0, b"\xeb\x52\x90NTFS    "), signature], [(0, b"\xeb\x76\x90EXFAT   "), signature],
        [(0, b"\xeb\x3c\x90mkfs.fat"), signature], [(0, b"\xe9\0\0MSDOS5.0"), (510, b"\x55\0")],
        [signature], [signature, (SECTOR, b"EFI PART")], [(SECTOR, b"EFI PART")], [(1024, b"H+\0\4\0\0\0\0")],
        [(1024, b"H+\0\4\0\0\x20\0")], [(0, b"\xeb\x58\x90"), (510, b"\x55\0"), (3, b"NTFS    ")],
    ]
    features = [(0, 0, 0), (4, 0, 0), (4, 0x3F, 7), (4, 0x40, 0), (4, 0, 8), (4, 0xFFFFFFFF, 0), (0, 0x40, 8)]
    boot_sectors += [ext_superblock(*words) for words in features]
    boot_sectors += [ext_superblock(*words) + [signature] for words in features]
    for pieces in boot_sectors:
        for size in (0, 511, 512, 1023, 1024, 1535, 1536, 2047, 2048, 4096):
            yield image(size, *pieces, answer=size % 8)
    for text in HOSTILE:
        yield image(2048, (0, text[:SECTOR]), (1024, text[:SECTOR]), answer=0)


def database(rows, page_size=512, encoding="UTF-8", schema=None):
    """The bytes of a database file."""
    with tempfile.TemporaryDirectory() as directory:
        path = f"{directory}/disk.db"
        connection = sqlite3.connect(path)
        connection.execute(f"pragma page_size={page_size}")
        connection.execute(f"pragma encoding='{encoding}'")
        connection.execute(schema or "CREATE TABLE disk (uid TEXT,dev_name TEXT,disk_name TEXT,"
                                     "mount_path TEXT,mountd TEXT);")
        for row in rows:
            marks = ",".join("?" * len(row))
            connection.execute(f"insert into disk values({marks})", row)
        connection.commit()
        connection.close()
        return pathlib.Path(path).read_bytes()


def db_file():
    row = ("1234-ABCD", "sda1", "disk1_part1", "/tmp/mountd/disk1_part1", "yes")
    valid = database([row])
    yield valid
    yield joined(valid, valid[:100])
    for page_size in (512, 1024, 4096):
        yield database([], page_size)
        yield database([(f"uid-{i}", *row[1:]) for i in range(40)] + [row], page_size)
    for encoding in ("UTF-16le", "UTF-16be"):
        yield database([row, row], encoding=encoding)
    yield database([("1234-ABCD",)], schema="CREATE TABLE disk (uid TEXT)")
    yield database([row], schema="CREATE TABLE disk (uid TEXT primary key,a,b,c,d) without rowid")
    yield database([row], schema="CREATE TABLE disk (uid BLOB,a INT,b REAL,c BLOB,d NUMERIC)")
    yield database([], schema="CREATE TABLE other (x)")
    yield database([], schema="CREATE VIEW disk AS SELECT 1")
    for text in HOSTILE:
        yield database([(text, text, text, text, text), (row[0], text, text, text, text)])
    yield b""
    yield b"SQLite format 3\0"
    yield b"no database at all"
    # A cut file, and one whose pages are exchanged.
    yield valid[:700]
    yield valid[512:] + valid[:512]


def db_rows():
    for text in HOSTILE:
        yield joined(b"\0", text, text, b"sdb1", b"disk2_part1", b"/tmp/mountd/disk2_part1", b"yes")
        yield joined(b"\0\3", b"1-2", text, text, text, text, text)
        yield joined(b"\0\3\0\0\0\0\3", b"1-2", *[text] * 10)
    for path in MOUNT_PATHS:
        for first in (b"\0", b"\1"):
            yield joined(first + b"\3", b"1234-ABCD", b"", b"sdb1", b"name", path, b"no")
            yield joined(first, b"1234-ABCD", b"other", b"sdb1", b"name", path, b"no")
    for use in range(4):
        yield joined(b"\0" + bytes([use]) * 10, b"1", *[b"1"] * 10)
    yield joined(b"\0\3\0\0\0\0\3\0\0\0\0\3", b"two", *[b"x"] * 15)


def inventory():
    # One disk: its flags, the slots in use, and for each record four texts, two numbers and a type.
    record = bytes([0, 1, 2, 3, 1, 244, 4, 0, 7, 0, 7])
    for text in HOSTILE:
        yield joined(b"\1\2" + record + b"\3" + record * 2, b"sda1", b"disk1_part1", text, text)
    yield joined((b"\1\3" + record + b"\xff" + record * 8) * 16, b"sda1", b"disk1_part1", b"u", b"l")
    for shift in range(64):
        numbers = bytes([255, 255, shift, 128, 1, shift])
        yield joined(b"\1\2\0\0\0\0" + numbers + bytes([shift % 16]) + b"\0", b"a")
    yield joined(b"\0\0\1\0\0\0\1", b"a")
    yield b""


KEYS = [b'UUID="', b'PARTUUID="', b'LABEL="', b'PARTLABEL="', b'TYPE="', b'SEC_TYPE="', b'PTTYPE="', b"/dev/sda1: "]
WORDS = {
    event_stream: [b"#add:", b"#remove_dev:", b"#remove_disk:", b"#safe_remove", b"#heart_beat", b"sda1", b"sda",
                   b"mmcblk0p1", b"mmcblk0", b"disk0_part1", b"\n", b"\r", b";", b"\0"],
    mount_listing: [b"/dev/sda1 on ", b"/dev/sdb2 on ", b"/dev/mmcblk0p1 on ", b"/tmp/mountd/disk", b"/tmp/mountd",
                    b"_part", b" type ext4 (rw)\n", b"2147483648", b"4294967297", b"9223372036854775808"],
    blkid_output: KEYS + [b"ext2", b"ext3", b"ext4", b"vfat", b"ntfs", b"exfat", b"\" ", b"-", b"\n"],
    label_script: [b"\t", b"\n", b"\r", b"\0", b" "],
    pid_file: [b"\n", b"\0", b"1", b"-"],
    device_image: [b"NTFS    ", b"EXFAT", b"EFI PART", b"H+", b"\x53\xef", b"\x55\xaa", b"\xeb\x3c\x90", b"\xe9",
                   b"\xfe\x01\x02\x55\xaa", b"\x38\x04\x02\x53\xef", b"\x5c\x04\x01\x04", b"\x00\x04\x02H+",
                   b"\x00\x02\x08EFI PART", b"\x03\x00\x08NTFS    ", b"\x03\x00\x05EXFAT"],
    db_file: [b"SQLite format 3\0", b"disk", b"table", b"index", b"view", b"trigger", b"1234-ABCD", b"CREATE TABLE ",
              b"CREATE TRIGGER x AFTER UPDATE ON disk BEGIN SELECT 1; END", b"\x0d", b"\x05", b"\x0a", b"\x02",
              b"\x7f\xff\xff\xff", b"\xff\xff\xff\xff\xff\xff\xff\xff\xff", b"\xd9\xd5\x05\xf9\x20\xa1\x63\xd7"],
    db_rows: [b"/tmp/mountd/", b"disk1_part2", b"yes", b"no", b"1234-ABCD", b"'", b"''", b";", b"$(", b"`", b"\n"],
    inventory: [b'"', b"\\", b"\n", b"\x1f", b"\x7f", b"\\u0000", b"/", b"\xff\xff\x2f"],
}


def dictionary(words):
    lines = []
    for word in words + [SEPARATOR]:
        lines.append('"' + "".join(f"\\x{byte:02x}" for byte in word) + '"\n')
    return "".join(lines)


def main(directory):
    root = pathlib.Path(directory)
    for target, words in WORDS.items():
        corpus = root / target.__name__
        corpus.mkdir(parents=True, exist_ok=True)
        for number, seed in enumerate(target()):
            (corpus / f"seed-{number:04}").write_bytes(seed)
        (root / f"{target.__name__}.dict").write_text(dictionary(words))


if __name__ == "__main__":
    main(sys.argv[1])
