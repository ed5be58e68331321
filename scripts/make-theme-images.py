#!/usr/bin/env python3
"""Draws the pictures of the list view's themes into res/edje/images/.

Every picture is white on a transparent background, so that the theme or the colour table
tints it. Shapes are described by distance functions and drawn with 4x4 supersampling.
Run from anywhere: python3 scripts/make-theme-images.py
"""
import math
import os
import struct
import zlib

OUT = os.path.join(os.path.dirname(os.path.abspath(__file__)), "..", "res", "edje", "images")
SUB = 4  # supersamples per axis


def write_png(path, width, height, alpha):
    """Writes white RGBA pixels with the given alpha values (row-major, 0..255)."""
    rows = bytearray()
    for y in range(height):
        rows.append(0)
        for x in range(width):
            rows += bytes((255, 255, 255, alpha[y * width + x]))

    def chunk(kind, data):
        return (struct.pack(">I", len(data)) + kind + data +
                struct.pack(">I", zlib.crc32(kind + data) & 0xFFFFFFFF))

    header = struct.pack(">IIBBBBB", width, height, 8, 6, 0, 0, 0)
    with open(path, "wb") as f:
        f.write(b"\x89PNG\r\n\x1a\n" + chunk(b"IHDR", header) +
                chunk(b"IDAT", zlib.compress(bytes(rows), 9)) + chunk(b"IEND", b""))


def render(width, height, inside):
    """Coverage of inside(x, y) (coordinates in 0..1 of the picture's width) per pixel."""
    alpha = []
    for py in range(height):
        for px in range(width):
            hits = 0
            for sy in range(SUB):
                for sx in range(SUB):
                    x = (px + (sx + 0.5) / SUB) / width
                    y = (py + (sy + 0.5) / SUB) / width
                    hits += inside(x, y)
            alpha.append(round(255 * hits / (SUB * SUB)))
    return alpha


def seg_dist(x, y, ax, ay, bx, by):
    """Distance from (x, y) to the segment a-b."""
    dx, dy = bx - ax, by - ay
    t = max(0.0, min(1.0, ((x - ax) * dx + (y - ay) * dy) / (dx * dx + dy * dy)))
    return math.hypot(x - (ax + t * dx), y - (ay + t * dy))


def in_disc(x, y, r=0.5):
    return math.hypot(x - 0.5, y - 0.5) <= r


def cancel_badge(x, y):
    """A round badge with an X cut out of it."""
    if not in_disc(x, y, 0.48):
        return False
    d = 0.17
    cross = min(seg_dist(x, y, 0.5 - d, 0.5 - d, 0.5 + d, 0.5 + d),
                seg_dist(x, y, 0.5 - d, 0.5 + d, 0.5 + d, 0.5 - d))
    return cross > 0.055


def upload_badge(x, y):
    """A round badge with an upward arrow cut out of it."""
    if not in_disc(x, y, 0.48):
        return False
    arrow = min(seg_dist(x, y, 0.5, 0.28, 0.5, 0.72),
                seg_dist(x, y, 0.5, 0.28, 0.32, 0.46),
                seg_dist(x, y, 0.5, 0.28, 0.68, 0.46))
    return arrow > 0.055


def no_uploads(x, y):
    """A cloud outline with an upward arrow through its base: the empty list's picture."""
    lobes = ((0.32, 0.45, 0.15), (0.52, 0.36, 0.20), (0.70, 0.47, 0.13))

    def cloud(shrink):
        body = 0.32 <= x <= 0.70 and 0.45 <= y <= 0.60 - shrink
        return y <= 0.60 - shrink and (body or any(
            math.hypot(x - cx, y - cy) <= r - shrink for cx, cy, r in lobes))

    outline = cloud(0.0) and not cloud(0.03)
    if abs(x - 0.51) < 0.065 and y > 0.5:
        outline = False  # the gap the arrow goes through
    arrow = min(seg_dist(x, y, 0.51, 0.42, 0.51, 0.74),
                seg_dist(x, y, 0.51, 0.42, 0.43, 0.50),
                seg_dist(x, y, 0.51, 0.42, 0.59, 0.50))
    return outline or arrow <= 0.016


def thumb_placeholder(x, y):
    """A play triangle in a circle outline, drawn where a video has no thumbnail."""
    r = math.hypot(x - 0.5, y - 0.5)
    if 0.30 <= r <= 0.34:
        return True
    # triangle pointing right, centred a little right of the middle
    ax, ay, bx, by, cx, cy = 0.42, 0.36, 0.42, 0.64, 0.65, 0.5
    def side(px, py, qx, qy, rx, ry):
        return (px - rx) * (qy - ry) - (qx - rx) * (py - ry)
    s1 = side(x, y, ax, ay, bx, by)
    s2 = side(x, y, bx, by, cx, cy)
    s3 = side(x, y, cx, cy, ax, ay)
    return (s1 <= 0 and s2 <= 0 and s3 <= 0) or (s1 >= 0 and s2 >= 0 and s3 >= 0)


def rounded_square(x, y, half, radius):
    """Inside a square of half-size half around the middle, with corners of that radius."""
    dx = max(abs(x - 0.5) - (half - radius), 0.0)
    dy = max(abs(y - 0.5) - (half - radius), 0.0)
    return math.hypot(dx, dy) <= radius


def check_box(x, y):
    """The filled box of a check box that is on."""
    return rounded_square(x, y, 0.46, 0.12)


def check_outline(x, y):
    """The frame of a check box that is off."""
    return rounded_square(x, y, 0.46, 0.12) and not rounded_square(x, y, 0.36, 0.04)


def check_mark(x, y):
    """The tick drawn over the filled box."""
    return min(seg_dist(x, y, 0.25, 0.52, 0.42, 0.69),
               seg_dist(x, y, 0.42, 0.69, 0.76, 0.33)) <= 0.065


def main():
    os.makedirs(OUT, exist_ok=True)
    pictures = (
        ("core_button_cancel.png", 96, 96, cancel_badge),
        ("zuvo_icon_badge_upload.png", 96, 96, upload_badge),
        ("zv_nocontents_uploads.png", 240, 192, no_uploads),
        ("zv_thumb_placeholder.png", 96, 96, thumb_placeholder),
        ("zv_check_box.png", 96, 96, check_box),
        ("zv_check_outline.png", 96, 96, check_outline),
        ("zv_check_mark.png", 96, 96, check_mark),
    )
    for name, w, h, shape in pictures:
        write_png(os.path.join(OUT, name), w, h, render(w, h, shape))
        print("wrote", os.path.normpath(os.path.join(OUT, name)))


if __name__ == "__main__":
    main()
