"""Hostile icons, in the bundle of an application on the home screen that is drawn."""

import os
import zlib

import packages
from build import END, SIGNATURE, chunk, picture, pixels, png_header
from entry import Entry


def shows_letter(place, done):
    """What cannot be used is as good as none: the application's first letter."""
    assert place.out.read_bytes() == (place.templates / "letter.png").read_bytes()


def shows_icon(place, done):
    assert place.out.read_bytes() != (place.templates / "letter.png").read_bytes()


def icon(name, content, also=shows_letter):
    def make(place):
        path = place.container_of("com.example.app00") / "App00.app" / "Icon.png"
        path.unlink()
        if callable(content):
            content(path, place)
        else:
            path.write_bytes(content)

    return Entry(name, make, ("screen", "{device}", "{out}"), 0, also=also)


def rows(width, height, bytes_per_pixel):
    return bytes((width * bytes_per_pixel + 1) * height)


RED = packages.png()
PALETTE = picture(png_header(4, 4, 8, 3), chunk(b"PLTE", b"\xff\0\0"), pixels((b"\0" + bytes(4)) * 4), END)

ENTRIES = [
    icon("empty", b""),
    icon("not a picture", b"GIF89a" + bytes(200)),
    icon("a JPEG", b"\xff\xd8\xff\xe0\0\x10JFIF\0" + bytes(300)),
    icon("signature only", SIGNATURE),
    icon("cut off in the pixels", RED[:60]),
    icon("cut off before the end", RED[:-12]),
    icon("2^31 pixels wide", picture(png_header(2**31 - 1, 1), pixels(bytes(100)), END)),
    icon("2^31 pixels either way", picture(png_header(2**31 - 1, 2**31 - 1), pixels(bytes(100)), END)),
    icon("2^32 - 1 pixels wide", picture(png_header(2**32 - 1, 1), pixels(bytes(100)), END)),
    icon("no pixels", picture(png_header(0, 0), pixels(b""), END)),
    icon("a bomb of 4096 x 4096 pixels", picture(png_header(4096, 4096), pixels(rows(4096, 4096, 3)), END)),
    icon("a bomb of 2048 x 2048 pixels", picture(png_header(2048, 2048, 8, 6), pixels(rows(2048, 2048, 4)), END),
         shows_icon),
    icon("fewer pixels than told", picture(png_header(4096, 1024), pixels(bytes(10)), END)),
    icon("far more pixels than told", picture(png_header(2, 2), pixels(bytes(20 << 20)), END), None),
    icon("a wrong CRC of the header", picture(png_header(64, 64, crc=1), RED[33:])),
    icon("a wrong CRC of the pixels", RED[:41] + bytes([RED[41] ^ 1]) + RED[42:], None),
    icon("pixels that are not packed", picture(png_header(8, 8), chunk(b"IDAT", b"hello"), END)),
    icon("interlaced, cut off", picture(png_header(64, 64, interlace=1), chunk(b"IDAT", zlib.compress(bytes(50))), END)),
    icon("an unknown interlacing", picture(png_header(8, 8, interlace=7), pixels(rows(8, 8, 3)), END)),
    icon("an unknown colour type", picture(png_header(8, 8, 8, 5), pixels(rows(8, 8, 3)), END)),
    icon("an impossible depth", picture(png_header(8, 8, 3, 2), pixels(rows(8, 8, 3)), END)),
    icon("a palette that is missing", picture(png_header(4, 4, 8, 3), pixels((b"\0" + bytes(4)) * 4), END)),
    icon("a palette of two and a half colours",
         picture(png_header(4, 4, 8, 3), chunk(b"PLTE", bytes(7)), pixels((b"\0" + bytes(4)) * 4), END)),
    icon("pixels beyond the palette",
         picture(png_header(4, 4, 8, 3), chunk(b"PLTE", b"\xff\0\0"), pixels((b"\0" + b"\xff" * 4) * 4), END), None),
    icon("transparency of more colours than there are",
         picture(png_header(4, 4, 8, 3), chunk(b"PLTE", b"\xff\0\0"), chunk(b"tRNS", bytes(256)),
                 pixels((b"\0" + bytes(4)) * 4), END), None),
    icon("a chunk of 2^31 bytes", picture(png_header(8, 8), chunk(b"tEXt", b"a", size=2**31 - 1), pixels(rows(8, 8, 3)))),
    icon("packed text of 30 MiB",
         picture(png_header(8, 8), chunk(b"zTXt", b"a\0\0" + zlib.compress(bytes(30 << 20), 9)),
                 pixels(rows(8, 8, 3)), END), None),
    icon("a colour profile of 30 MiB",
         picture(png_header(8, 8), chunk(b"iCCP", b"a\0\0" + zlib.compress(bytes(30 << 20), 9)),
                 pixels(rows(8, 8, 3)), END), None),
    icon("20,000 chunks of text",
         picture(png_header(8, 8), chunk(b"tEXt", b"a\0b") * 20_000, pixels(rows(8, 8, 3)), END), None),
    icon("17 MiB of file", picture(png_header(8, 8), chunk(b"juNK", bytes(17 << 20)), pixels(rows(8, 8, 3)), END)),
    icon("a directory", lambda path, place: path.mkdir()),
    icon("a pipe", lambda path, place: os.mkfifo(path)),
    icon("a link out of the device", lambda path, place: path.symlink_to(place.outside / "secret")),
    icon("a link to itself", lambda path, place: path.symlink_to(path.name)),
    icon("a link to a good picture outside",
         lambda path, place: ((place.device / "picture.png").write_bytes(RED), path.symlink_to(
             place.device / "picture.png"))),
]
