#!/usr/bin/env python3
"""Tracks points through a numbered sequence of 8-bit PGM frames (the depth it takes) with OpenCV's
pyramidal Lucas-Kanade, frame to frame, as the peer of bench/TrackBench.cpp.

    opencv_lk_track.py FOLDER COUNT WINDOW LEVELS X,Y [X,Y ...]

Frames are FOLDER/frame_0000.pgm and on; points are in OpenCV's pixel
coordinates (pixel centres on whole numbers, rows from the top). Prints one
line "pos K x y x y ..." per frame and "seconds_per_frame S", the time of the
tracking calls alone (reading the files is not counted).
"""
import sys
import time

import cv2
import numpy as np


def main():
    folder, count, window, levels = sys.argv[1], int(sys.argv[2]), int(sys.argv[3]), int(sys.argv[4])
    points = np.array([[float(v) for v in p.split(",")] for p in sys.argv[5:]], np.float32).reshape(-1, 1, 2)
    criteria = (cv2.TERM_CRITERIA_EPS | cv2.TERM_CRITERIA_COUNT, 30, 0.001)
    prev = cv2.imread(f"{folder}/frame_0000.pgm", cv2.IMREAD_UNCHANGED)
    print("pos 0 " + " ".join(f"{v:.6f}" for v in points.ravel()))
    spent = 0.0
    for k in range(1, count):
        frame = cv2.imread(f"{folder}/frame_{k:04d}.pgm", cv2.IMREAD_UNCHANGED)
        start = time.perf_counter()
        points, _, _ = cv2.calcOpticalFlowPyrLK(prev, frame, points, None, winSize=(window, window),
                                                maxLevel=levels, criteria=criteria)
        spent += time.perf_counter() - start
        print(f"pos {k} " + " ".join(f"{v:.6f}" for v in points.ravel()))
        prev = frame
    print(f"seconds_per_frame {spent / max(1, count - 1):.9f}")


if __name__ == "__main__":
    main()
