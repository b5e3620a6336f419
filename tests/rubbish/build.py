"""Builds files byte by byte, true or not."""

import io
import struct
import zipfile
import zlib

import packages


# Binary property lists.


def binary_list(objects, references=1, top=0, count=None, offset_size=1, table=None, offsets=None,
                magic=b"bplist00", tail=b""):
    """A binary property list of encoded objects. What is not given is told as it is."""
    body, places = magic, []
    for each in objects:
        places.append(len(body))
        body += each
    table_at = len(body) if table is None else table
    for place in places if offsets is None else offsets:
        body += place.to_bytes(max(offset_size, 1), "big")
    count = len(objects) if count is None else count
    return body + tail + struct.pack(">6xBBQQQ", offset_size, references, count, top, table_at)


def array_of(*references, width=1):
    size = len(references)
    head = bytes([0xA0 | size]) if size < 15 else b"\xaf\x12" + struct.pack(">I", size)
    return head + b"".join(each.to_bytes(width, "big") for each in references)


def map_of(keys, values):
    return bytes([0xD0 | len(keys)]) + bytes(keys) + bytes(values)


def text(value):
    return bytes([0x50 | len(value)]) + value


# PNG pictures.

SIGNATURE = b"\x89PNG\r\n\x1a\n"


def chunk(kind, data, crc=None, size=None):
    crc = zlib.crc32(kind + data) if crc is None else crc
    return struct.pack(">I", len(data) if size is None else size) + kind + data + struct.pack(">I", crc)


def png_header(width, height, depth=8, colour=2, interlace=0, **more):
    return chunk(b"IHDR", struct.pack(">IIBBBBB", width, height, depth, colour, 0, 0, interlace), **more)


def picture(*chunks):
    return SIGNATURE + b"".join(chunks)


def pixels(data):
    return chunk(b"IDAT", zlib.compress(data, 9))


END = chunk(b"IEND", b"")


# Archives.


class Zip:
    """An archive, written entry by entry; each may say something else than it is."""

    def __init__(self):
        self.body, self.directory, self.count = b"", b"", 0

    def add(self, name, content=b"", mode=0o100644, packed=None, method=0, local_name=None, crc=None,
            size=None, packed_size=None, flags=0, extra=b"", version=20, offset=None, system=3,
            local=None, local_extra=None, after=b"", listed=True):
        """`local` is what the local header says of CRC, packed size and size instead; `after` stands after
        the contents."""
        name = name if isinstance(name, bytes) else name.encode()
        local_name = name if local_name is None else local_name
        packed = content if packed is None else packed
        crc = zlib.crc32(content) if crc is None else crc
        size = len(content) if size is None else size
        packed_size = len(packed) if packed_size is None else packed_size
        at = len(self.body) if offset is None else offset
        head = struct.pack("<HHHHHIII", version, flags, method, 0, 0x21, crc, packed_size, size)
        if offset is None:
            local_extra = extra if local_extra is None else local_extra
            local_head = head if local is None else head[:10] + struct.pack("<III", *local)
            self.body += b"PK\3\4" + local_head + struct.pack("<HH", len(local_name), len(local_extra))
            self.body += local_name + local_extra + packed + after
        if not listed:
            return self
        self.directory += b"PK\1\2" + struct.pack("<BB", 20, system) + head + struct.pack(
            "<HHHHHII", len(name), len(extra), 0, 0, 0, mode << 16, at) + name + extra
        self.count += 1
        return self

    def end(self, count=None, size=None, at=None, comment=b"", before=b"", disk=0):
        count = self.count if count is None else count
        size = len(self.directory) if size is None else size
        at = len(self.body) if at is None else at
        return self.body + self.directory + before + b"PK\5\6" + struct.pack(
            "<HHHHIIH", disk, disk, count, count, size, at, len(comment)) + comment

    def end64(self, count=None, size=None, at=None):
        """With the end of large archives."""
        count = self.count if count is None else count
        size = len(self.directory) if size is None else size
        at = len(self.body) if at is None else at
        large = b"PK\6\6" + struct.pack("<QHHIIQQQQ", 44, 45, 45, 0, 0, count, count, size, at)
        locator = b"PK\6\7" + struct.pack("<IQI", 0, len(self.body) + len(self.directory), 1)
        return self.end(count=0xFFFF, size=0xFFFFFFFF, at=0xFFFFFFFF, before=large + locator)


def descriptor(content, packed=None, signature=b"PK\7\10", width="I", **lies):
    """What follows the contents of an entry that was streamed."""
    packed = content if packed is None else packed
    told = {"crc": zlib.crc32(content), "packed_size": len(packed), "size": len(content), **lies}
    return signature + struct.pack("<I" + 2 * width, told["crc"], told["packed_size"], told["size"])


def zip_of(items):
    """A plain archive of (name or ZipInfo, content) pairs."""
    file = io.BytesIO()
    with zipfile.ZipFile(file, "w", zipfile.ZIP_DEFLATED) as archive:
        for name, data in items:
            archive.writestr(name if isinstance(name, zipfile.ZipInfo) else packages.entry(name), data)
    return file.getvalue()


def zeros(size):
    """That many zero bytes, deflated."""
    packer = zlib.compressobj(9, zlib.DEFLATED, -15)
    return packer.compress(bytes(size)) + packer.flush()
