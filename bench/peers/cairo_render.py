#!/usr/bin/env python3
"""Fills and strokes one path with Cairo, as the peer of bench/ShapeBench.cpp (BM_ShapeRenderLongPath).

    cairo_render.py PATH_FILE OUT.pgm WIDTH HEIGHT FRAMES LINE_WIDTH MITER_LIMIT FILL_RGBA(4) LINE_RGBA(4)

PATH_FILE holds lines "M x y", "L x y", "C x1 y1 x2 y2 x y" and "Z" in pixels, rows from the top. The path is
filled (non-zero rule) in the fill colour, then stroked (mitred joins, flat caps) in the line colour, both over
transparent black in an ARGB32 surface, FRAMES times. Writes the last frame's alpha as an 8-bit PGM (rows from
the top) and prints "seconds_per_frame S", the time of the clearing, fill and stroke calls alone.
"""
import sys
import time

import cairo


def read_path(name):
    ops = []
    with open(name) as f:
        for line in f:
            parts = line.split()
            if parts:
                ops.append((parts[0], [float(v) for v in parts[1:]]))
    return ops


def trace(ctx, ops):
    for op, v in ops:
        if op == "M":
            ctx.move_to(*v)
        elif op == "L":
            ctx.line_to(*v)
        elif op == "C":
            ctx.curve_to(*v)
        elif op == "Z":
            ctx.close_path()


def main():
    path_file, out = sys.argv[1], sys.argv[2]
    width, height, frames = int(sys.argv[3]), int(sys.argv[4]), int(sys.argv[5])
    line_width, miter_limit = float(sys.argv[6]), float(sys.argv[7])
    fill = [float(v) for v in sys.argv[8:12]]
    line = [float(v) for v in sys.argv[12:16]]
    ops = read_path(path_file)
    surface = cairo.ImageSurface(cairo.FORMAT_ARGB32, width, height)
    ctx = cairo.Context(surface)
    spent = 0.0
    for _ in range(frames):
        start = time.perf_counter()
        ctx.set_operator(cairo.OPERATOR_CLEAR)
        ctx.paint()
        ctx.set_operator(cairo.OPERATOR_OVER)
        ctx.new_path()
        trace(ctx, ops)
        ctx.set_fill_rule(cairo.FILL_RULE_WINDING)
        ctx.set_source_rgba(*fill)
        ctx.fill_preserve()
        ctx.set_line_width(line_width)
        ctx.set_line_join(cairo.LINE_JOIN_MITER)
        ctx.set_line_cap(cairo.LINE_CAP_BUTT)
        ctx.set_miter_limit(miter_limit)
        ctx.set_source_rgba(*line)
        ctx.stroke()
        surface.flush()
        spent += time.perf_counter() - start
    data = surface.get_data()
    stride = surface.get_stride()
    # ARGB32 is native-endian 32-bit words: alpha is the high byte, the fourth byte on little-endian machines.
    alpha_byte = 3 if sys.byteorder == "little" else 0
    with open(out, "wb") as f:
        f.write(b"P5\n%d %d\n255\n" % (width, height))
        for y in range(height):
            f.write(bytes(data[y * stride + alpha_byte:y * stride + 4 * width:4]))
    print(f"seconds_per_frame {spent / max(1, frames):.9f}")


if __name__ == "__main__":
    main()
