#!/usr/bin/env python3
"""Helpers of scripts/screenshots.sh.

  screenshots.py prepare WORKDIR CLIENT   records four videos through the companion client,
                                          then gives them the states of the screenshot
                                          (waiting, uploading, paused, completed) and
                                          thumbnails; uses the ZV_* environment
  screenshots.py xwd2png XWD PNG          converts an X window dump (Xvfb -fbdir) to PNG
  screenshots.py title-colour PNG TABLE   checks that the title bar of the picture has the
                                          colour table's AO002
"""
import math
import os
import re
import sqlite3
import struct
import subprocess
import sys
import zlib


def png_bytes(width, height, rows):
    """An RGB PNG from rows of bytes (3 per pixel)."""
    raw = b"".join(b"\0" + bytes(row) for row in rows)

    def chunk(kind, data):
        return (struct.pack(">I", len(data)) + kind + data +
                struct.pack(">I", zlib.crc32(kind + data) & 0xFFFFFFFF))

    return (b"\x89PNG\r\n\x1a\n" +
            chunk(b"IHDR", struct.pack(">IIBBBBB", width, height, 8, 2, 0, 0, 0)) +
            chunk(b"IDAT", zlib.compress(raw, 9)) + chunk(b"IEND", b""))


def thumbnail(path, sky, ground):
    """A 160 x 120 landscape-like picture: sky, a sun, rolling ground."""
    w, h = 160, 120

    def shade(rgb, light):
        return [min(255, int(c * light)) for c in rgb]

    rows = []
    for y in range(h):
        row = []
        for x in range(w):
            horizon = 0.62 * h + 8 * math.sin(x / 23.0)
            if math.hypot(x - 0.72 * w, y - 0.3 * h) < 13:
                row += [255, 243, 196]
            elif y < horizon:
                row += shade(sky, 0.75 + 0.5 * y / horizon)
            else:
                row += shade(ground, 1.0 - 0.4 * (y - horizon) / h)
        rows.append(row)
    with open(path, "wb") as f:
        f.write(png_bytes(w, h, rows))


JOBS = (  # title, status, percent, sky, ground
    ("Concert in the park", 4, 100, (155, 127, 209), (60, 58, 94)),
    ("Morning run", 2, 70, (127, 178, 229), (47, 95, 138)),
    ("Sunset at the lake", 3, 45, (224, 138, 74), (107, 74, 46)),
    ("Birthday party", 0, 0, (74, 144, 217), (63, 125, 58)),
)


def prepare(workdir, client):
    history = os.environ["ZV_HISTORY_DB"]
    media = os.environ["ZV_MEDIA_DB"]
    for i, (title, status, percent, sky, ground) in enumerate(JOBS):
        video = os.path.join(workdir, "VID_2024061%d_18150%d.mp4" % (i, i))
        with open(video, "wb") as f:
            f.write(os.urandom(64 * 1024))
        out = subprocess.run([client, "add", video, "--title", title], check=True,
                             capture_output=True, text=True).stdout
        historyid = int(out.split("\t")[0])
        thumb = os.path.join(workdir, "thumb%d.png" % i)
        thumbnail(thumb, sky, ground)
        with sqlite3.connect(history) as db:
            db.execute("UPDATE history SET status = ?, percent = ?, date = ? WHERE historyid = ?",
                       (status, percent, float(i + 1), historyid))
        with sqlite3.connect(media) as db:
            db.execute("UPDATE media SET thumbnail_path = ? WHERE path = ?",
                       (thumb, os.path.realpath(video)))


def xwd2png(xwd_path, png_path):
    data = open(xwd_path, "rb").read()
    fields = struct.unpack(">25I", data[:100])
    if fields[1] != 7:  # file_version: the header is in the other byte order
        fields = struct.unpack("<25I", data[:100])
    header_size, width, height = fields[0], fields[4], fields[5]
    byte_order, bits_per_pixel, bytes_per_line = fields[7], fields[11], fields[12]
    masks, ncolors = fields[14:17], fields[19]
    if bits_per_pixel != 32:
        sys.exit("xwd2png: %d bits per pixel is not supported" % bits_per_pixel)
    offset = header_size + ncolors * 12
    fmt = "<I" if byte_order == 0 else ">I"
    shifts = [(m & -m).bit_length() - 1 for m in masks]
    rows = []
    for y in range(height):
        line = data[offset + y * bytes_per_line: offset + y * bytes_per_line + width * 4]
        row = bytearray()
        for (pixel,) in struct.iter_unpack(fmt, line):
            row += bytes(((pixel & m) >> s) & 0xFF for m, s in zip(masks, shifts))
        rows.append(row)
    with open(png_path, "wb") as f:
        f.write(png_bytes(width, height, rows))


def png_pixel(path, x, y):
    """The RGB of one pixel of an 8-bit RGB or RGBA PNG (as png_bytes and Evas write them)."""
    data = open(path, "rb").read()
    pos, idat, width, channels = 8, b"", 0, 3
    while pos < len(data):
        (length,) = struct.unpack(">I", data[pos:pos + 4])
        kind, body = data[pos + 4:pos + 8], data[pos + 8:pos + 8 + length]
        if kind == b"IHDR":
            width, color_type = struct.unpack(">I", body[:4])[0], body[9]
            channels = 4 if color_type == 6 else 3
        elif kind == b"IDAT":
            idat += body
        pos += 12 + length
    raw = zlib.decompress(idat)
    stride = width * channels + 1
    prev = bytearray(width * channels)
    for row in range(y + 1):
        kind, line = raw[row * stride], bytearray(raw[row * stride + 1:(row + 1) * stride])
        for i in range(len(line)):
            a = line[i - channels] if i >= channels else 0
            b = prev[i]
            c = prev[i - channels] if i >= channels else 0
            if kind == 1:
                line[i] = (line[i] + a) & 0xFF
            elif kind == 2:
                line[i] = (line[i] + b) & 0xFF
            elif kind == 3:
                line[i] = (line[i] + (a + b) // 2) & 0xFF
            elif kind == 4:
                p = a + b - c
                pa, pb, pc = abs(p - a), abs(p - b), abs(p - c)
                line[i] = (line[i] + (a if pa <= pb and pa <= pc else b if pb <= pc else c)) & 0xFF
        prev = line
    return tuple(prev[x * channels:x * channels + 3])


def title_colour(png, table):
    match = re.search(r'code="AO002" r="(\d+)" g="(\d+)" b="(\d+)"', open(table).read())
    want = tuple(int(v) for v in match.groups())
    got = png_pixel(png, 4, 4)
    if got != want:
        sys.exit("%s: title bar %s, but AO002 of %s is %s" % (png, got, table, want))
    print("%s: title bar AO002 %s" % (png, got))


def main():
    if len(sys.argv) == 4 and sys.argv[1] == "prepare":
        prepare(sys.argv[2], sys.argv[3])
    elif len(sys.argv) == 4 and sys.argv[1] == "xwd2png":
        xwd2png(sys.argv[2], sys.argv[3])
    elif len(sys.argv) == 4 and sys.argv[1] == "title-colour":
        title_colour(sys.argv[2], sys.argv[3])
    else:
        sys.stderr.write(__doc__)
        sys.exit(2)


if __name__ == "__main__":
    main()
