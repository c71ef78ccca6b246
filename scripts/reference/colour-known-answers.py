#!/usr/bin/env python3
"""Known answers for the colour kernel, computed apart from it.

Every float operation of the per-pixel conversion and transfer is replayed in
Python: double arithmetic is Python's own, and each float operation is done
in double and rounded to float (exact for +, -, *, / since double holds more
than twice float's precision). The tables are rebuilt from their formulas.
Prints C++ initialisers with hex floats for tests/color/ColourKnownAnswers_tests.cpp.
"""
import math
import struct


def f32(x):
    return struct.unpack("f", struct.pack("f", x))[0]


def hexf(x):
    return float.hex(x).replace("0x1.", "0x1.").rstrip("0") + "f" if x != 0 else "0.0f"


N = 3001
gamma = [f32(math.pow(i / 3000.0, 2.2)) for i in range(N)]
inv_gamma = [f32(math.pow(i / 3000.0, 1.0 / 2.2)) for i in range(N)]
lab_tab = [f32(math.cbrt(x) if x > 0.008856 else 7.787037 * x + 16.0 / 116.0) for x in (i / 3000.0 for i in range(N))]

INV_WX = float.fromhex("0x1.0d54fap+0")
INV_WZ = float.fromhex("0x1.d63304p-1")
WX = float.fromhex("0x1.e6a7f0p-1")
WZ = float.fromhex("0x1.16c226p+0")
EPS = float.fromhex("0x1.a7b962p-3")
OFF = float.fromhex("0x1.1a7b96p-3")
SLOPE_INV = float.fromhex("0x1.07004ep-3")


def index(v):
    return int(f32(f32(v * 3000.0) + 0.5))


def rgb_to_lab(r8, g8, b8):
    r = gamma[index(f32(r8 / 255.0))]
    g = gamma[index(f32(g8 / 255.0))]
    b = gamma[index(f32(b8 / 255.0))]
    x = f32(0.412453 * r + 0.35758 * g + 0.180423 * b)
    y = f32(0.212671 * r + 0.71516 * g + 0.072169 * b)
    z = f32(0.019334 * r + 0.119193 * g + 0.950227 * b)
    x = f32(x * INV_WX)
    z = f32(z * INV_WZ)
    fx, fy, fz = lab_tab[index(x)], lab_tab[index(y)], lab_tab[index(z)]
    return (f32((fy * 116.0 - 16.0) / 100.0), f32(f32(fx - fy) * 500.0), f32(f32(fy - fz) * 200.0))


def expand(f):
    return f32(f32(f * f) * f) if f > EPS else f32(f32(f - OFF) * SLOPE_INV)


def encode(v):
    v = max(0.0, v) if not math.isnan(v) else 0.0
    v = v if v < 1.0 else 1.0
    return int(f32(inv_gamma[index(v)] * 255.0))


def lab_to_rgb(l, a, b):
    fy = f32((l * 100.0 + 16.0) / 116.0)
    fx = f32(a / 500.0 + fy)
    fz = f32(fy - b / 200.0)
    x = f32(expand(fx) * WX)
    y = expand(fy)
    z = f32(expand(fz) * WZ)
    r = f32(3.240479 * x - 1.53715 * y - 0.498535 * z)
    g = f32(-0.969256 * x + 1.875991 * y + 0.041556 * z)
    bl = f32(0.055648 * x - 0.204043 * y + 1.057311 * z)
    return (encode(r), encode(g), encode(bl))


# The transfer of the tests: a non-symmetric chroma map, means away from zero,
# and a tone curve (i/256)^2 capped at 0.5 (steep, then flat), exact in float.
CURVE = [min((i / 256.0) ** 2, 0.5) for i in range(257)]
CONTENT_MEAN = (f32(3.5), f32(-6.25))
STYLE_MEAN = (f32(-2.0), f32(9.75))
MATRIX = (f32(1.125), f32(0.375), f32(-0.25), f32(0.875))


def transfer(r8, g8, b8, low, high):
    l, a, b = rgb_to_lab(r8, g8, b8)
    spread = f32(high - low)
    t = 2147483648.0 if spread == 0 else f32(f32(l - low) / spread)
    t = max(0.0, t)
    t = t if t < 1.0 else 1.0
    x = f32(t * 255.0)
    x = min(max(x, 0.0), 255.0)
    k = int(x)
    f = f32(x - k)
    light = f32(f32(f32(1.0 - f) * CURVE[k]) + f32(f * CURVE[k + 1]))
    d0 = f32(a - CONTENT_MEAN[0])
    d1 = f32(b - CONTENT_MEAN[1])
    ca = f32(f32(f32(MATRIX[0] * d0) + f32(MATRIX[1] * d1)) + STYLE_MEAN[0])
    cb = f32(f32(f32(MATRIX[2] * d0) + f32(MATRIX[3] * d1)) + STYLE_MEAN[1])
    return lab_to_rgb(light, ca, cb)


COLOURS = [(0, 0, 0), (255, 255, 255), (255, 0, 0), (0, 255, 0), (0, 0, 255), (200, 150, 90),
           (17, 94, 201), (250, 20, 180), (1, 2, 3), (30, 20, 45), (128, 128, 127), (64, 200, 30), (233, 217, 202)]
LAB_INPUTS = [(0.5, 60.0, -40.0), (0.25, -30.5, 45.25), (0.9, 12.0, 80.0), (0.05, 3.0, -3.0),
              (0.7, -70.0, -20.0), (1.0, 0.0, 0.0), (0.0, 0.0, 0.0), (0.6, 100.0, 100.0),
              # black's own Lab; beyond the gamut, clamped; NaN, encoded as 0
              (float.fromhex("-0x1.47ae14p-31"), 0.0, 0.0), (2.0, 0.0, 0.0), (0.5, 300.0, 0.0), (math.nan,) * 3]

SPREAD = (f32(0.125), f32(0.875))
NO_SPREAD = (f32(0.4), f32(0.4))
print("// rgb, (L/100, a, b), transfer with low 0.125 high 0.875, transfer with low = high = 0.4")
for c in COLOURS:
    l, a, b = rgb_to_lab(*c)
    print("    {{%d, %d, %d}, {%s, %s, %s}, {%d, %d, %d}, {%d, %d, %d}}," %
          (c + (float.hex(l), float.hex(a), float.hex(b)) + transfer(*c, *SPREAD) + transfer(*c, *NO_SPREAD)))
print("// (L/100, a, b) -> rgb")
for lab in LAB_INPUTS:
    print("    {{%s, %s, %s}, {%d, %d, %d}}," % (tuple(float.hex(f32(v)) for v in lab) + lab_to_rgb(*map(f32, lab))))
