#!/usr/bin/env python3
"""OpenCV's radial lens map (initUndistortRectifyMap) and bilinear remap, as the peer of the Lens Distort tool:
tests/operators/warp/LensDistortPeerTest.cpp compares its pixels, bench/LensDistortBench.cpp its speed.

    opencv_lens_remap.py remap IN OUT W H FX FY CX CY K1 K2 BORDER DIRECTION SAMPLES
    opencv_lens_remap.py time IN W H FX FY CX CY K1 K2 RUNS

Images are raw RGBA float32, W x H, top row first (OpenCV's order). The camera matrix is (FX, FY, CX, CY) in
OpenCV's pixel coordinates (pixel centres on whole numbers, rows from the top), the distortion is radial only
(K1, K2; no tangential terms), and the rectified camera is the same matrix.

"remap" writes to OUT the input read bilinearly (BORDER "constant", zeros, or "replicate") at, for each of
SAMPLES x SAMPLES samples per output pixel, the forward polynomial of the sample's position (DIRECTION "forward":
initUndistortRectifyMap) or its inverse (DIRECTION "inverse": undistortPointsIter, iterated to 1e-12), the
samples of a pixel averaged (a SAMPLES-times larger map, shrunk by INTER_AREA, which averages whole blocks).

"time" prints, in seconds per frame (the median of RUNS runs after one
unmeasured run; reading the file and starting the interpreter are not counted):
    map_and_remap S   initUndistortRectifyMap (float maps) then remap, as a frame whose lens changes pays;
    remap S           remap alone with the float maps built beforehand, as a fixed lens pays;
    threads N         OpenCV's thread count.
"""
import statistics
import sys
import time

import cv2
import numpy as np


def read_rgba(path, w, h):
    return np.fromfile(path, dtype=np.float32).reshape(h, w, 4)


def camera(fx, fy, cx, cy, k1, k2):
    matrix = np.array([[fx, 0.0, cx], [0.0, fy, cy], [0.0, 0.0, 1.0]])
    return matrix, np.array([k1, k2, 0.0, 0.0])


def maps(matrix, coeffs, w, h, samples=1, inverse=False):
    # Sample (a, b) of the n-times larger grid lies at ((a + 0.5) / n - 0.5, (b + 0.5) / n - 0.5) in pixels of
    # the image: the camera of the grid is the image's scaled by n about the pixel corner (-0.5, -0.5).
    grid = matrix.copy()
    grid[:2, :] *= samples
    grid[:2, 2] += 0.5 * (samples - 1)
    size = (w * samples, h * samples)
    if not inverse:
        return cv2.initUndistortRectifyMap(matrix, coeffs, None, grid, size, cv2.CV_32FC1)
    ys, xs = np.mgrid[0 : size[1], 0 : size[0]].astype(np.float64)
    # Positions of the samples in the image's pixels, then their inverse, back in the image's pixels.
    points = np.stack(((xs - grid[0, 2]) / grid[0, 0] * matrix[0, 0] + matrix[0, 2],
                       (ys - grid[1, 2]) / grid[1, 1] * matrix[1, 1] + matrix[1, 2]), axis=-1).reshape(-1, 1, 2)
    criteria = (cv2.TERM_CRITERIA_COUNT | cv2.TERM_CRITERIA_EPS, 200, 1e-12)
    found = cv2.undistortPointsIter(points, matrix, coeffs, None, matrix, criteria).reshape(size[1], size[0], 2)
    return found[..., 0].astype(np.float32), found[..., 1].astype(np.float32)


def remap(args):
    src, dst = args[0], args[1]
    w, h = int(args[2]), int(args[3])
    matrix, coeffs = camera(*(float(v) for v in args[4:10]))
    border = {"constant": cv2.BORDER_CONSTANT, "replicate": cv2.BORDER_REPLICATE}[args[10]]
    samples = int(args[12])
    map_x, map_y = maps(matrix, coeffs, w, h, samples, args[11] == "inverse")
    out = cv2.remap(read_rgba(src, w, h), map_x, map_y, cv2.INTER_LINEAR, borderMode=border, borderValue=(0, 0, 0, 0))
    if samples > 1:
        out = cv2.resize(out, (w, h), interpolation=cv2.INTER_AREA)
    out.astype(np.float32).tofile(dst)


def measure(args):
    src = args[0]
    w, h = int(args[1]), int(args[2])
    matrix, coeffs = camera(*(float(v) for v in args[3:9]))
    runs = max(1, int(args[9]))
    plate = read_rgba(src, w, h)

    def both():
        map_x, map_y = maps(matrix, coeffs, w, h)
        return cv2.remap(plate, map_x, map_y, cv2.INTER_LINEAR)

    map_x, map_y = maps(matrix, coeffs, w, h)
    for name, work in (("map_and_remap", both), ("remap", lambda: cv2.remap(plate, map_x, map_y, cv2.INTER_LINEAR))):
        work()
        spent = []
        for _ in range(runs):
            start = time.perf_counter()
            work()
            spent.append(time.perf_counter() - start)
        print(f"{name} {statistics.median(spent):.9f}")
    print(f"threads {cv2.getNumThreads()}")


def main():
    if len(sys.argv) < 2 or sys.argv[1] not in ("remap", "time"):
        sys.exit(__doc__)
    (remap if sys.argv[1] == "remap" else measure)(sys.argv[2:])


if __name__ == "__main__":
    main()
