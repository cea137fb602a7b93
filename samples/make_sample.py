#!/usr/bin/env python3
"""Writes the project's sample model: sample.gltf (glTF 2.0 text), sample.bin
and checker.png, beside this script. Standard library only; the output is
deterministic, so running it again reproduces the committed files.

The scene exercises what the importer converts: nested nodes with translation,
rotation and scale, a mirrored node (negative scale), one mesh used by two
nodes, a textured material, a camera, a point light (KHR_lights_punctual), a
two-bone skin and a short animation.
"""

import json
import math
import os
import struct
import zlib

HERE = os.path.dirname(os.path.abspath(__file__))

FLOAT, UBYTE, USHORT = 5126, 5121, 5123
ARRAY_BUFFER, ELEMENT_ARRAY_BUFFER = 34962, 34963


class Buffer:
    """Collects binary chunks as buffer views and accessors."""

    def __init__(self):
        self.data = bytearray()
        self.views = []
        self.accessors = []

    def add(self, fmt, rows, component, kind, target=None, bounds=False, normalized=False):
        while len(self.data) % 4:
            self.data.append(0)
        offset = len(self.data)
        for row in rows:
            self.data += struct.pack("<" + fmt, *row)
        view = {"buffer": 0, "byteOffset": offset, "byteLength": len(self.data) - offset}
        if target:
            view["target"] = target
        self.views.append(view)
        accessor = {"bufferView": len(self.views) - 1, "componentType": component,
                    "count": len(rows), "type": kind}
        if normalized:
            accessor["normalized"] = True
        if bounds:
            accessor["min"] = [round(min(r[i] for r in rows), 6) for i in range(len(rows[0]))]
            accessor["max"] = [round(max(r[i] for r in rows), 6) for i in range(len(rows[0]))]
        self.accessors.append(accessor)
        return len(self.accessors) - 1


def box():
    """A unit box with a normal and texture coordinates per face corner."""
    positions, normals, uvs, indices = [], [], [], []
    for axis in range(3):
        for sign in (1.0, -1.0):
            normal = [0.0, 0.0, 0.0]
            normal[axis] = sign
            u_axis, v_axis = (axis + 1) % 3, (axis + 2) % 3
            base = len(positions)
            for u, v in ((-1, -1), (1, -1), (1, 1), (-1, 1)):
                p = [0.0, 0.0, 0.0]
                p[axis] = 0.5 * sign
                p[u_axis] = 0.5 * u * sign
                p[v_axis] = 0.5 * v
                positions.append(tuple(p))
                normals.append(tuple(normal))
                uvs.append(((u + 1) / 2, (1 - v) / 2))
            indices += [(base, base + 1, base + 2), (base, base + 2, base + 3)]
    return positions, normals, uvs, indices


def bar():
    """A square bar two units tall in two segments, for the two-bone skin.
    No normals: the importer generates them."""
    positions, joints, weights = [], [], []
    corners = ((-0.2, -0.2), (0.2, -0.2), (0.2, 0.2), (-0.2, 0.2))
    ring_weights = ((1.0, 0.0), (0.5, 0.5), (0.0, 1.0))
    for ring in range(3):
        for x, z in corners:
            positions.append((x, float(ring), z))
            joints.append((0, 1, 0, 0))
            w0, w1 = ring_weights[ring]
            weights.append((w0, w1, 0.0, 0.0))
    indices = []
    for ring in range(2):
        for side in range(4):
            a, b = ring * 4 + side, ring * 4 + (side + 1) % 4
            c, d = b + 4, a + 4
            indices += [(a, b, c), (a, c, d)]
    indices += [(0, 2, 1), (0, 3, 2), (8, 9, 10), (8, 10, 11)]
    return positions, joints, weights, indices


def quat_axis_angle(axis, degrees):
    half = math.radians(degrees) / 2
    s = math.sin(half)
    return tuple(round(c, 7) for c in (axis[0] * s, axis[1] * s, axis[2] * s, math.cos(half)))


def checker_png(size=4):
    """A size x size RGB checkerboard PNG."""
    rows = b""
    for y in range(size):
        rows += b"\x00"
        for x in range(size):
            rows += b"\xff\xff\xff" if (x + y) % 2 == 0 else b"\x30\x30\x30"

    def chunk(tag, body):
        return (struct.pack(">I", len(body)) + tag + body
                + struct.pack(">I", zlib.crc32(tag + body) & 0xFFFFFFFF))

    header = struct.pack(">IIBBBBB", size, size, 8, 2, 0, 0, 0)
    return (b"\x89PNG\r\n\x1a\n" + chunk(b"IHDR", header)
            + chunk(b"IDAT", zlib.compress(rows, 9)) + chunk(b"IEND", b""))


def build():
    buf = Buffer()
    bp, bn, bt, bi = box()
    box_pos = buf.add("3f", bp, FLOAT, "VEC3", ARRAY_BUFFER, bounds=True)
    box_nrm = buf.add("3f", bn, FLOAT, "VEC3", ARRAY_BUFFER)
    box_uv = buf.add("2f", bt, FLOAT, "VEC2", ARRAY_BUFFER)
    box_idx = buf.add("3H", bi, USHORT, "SCALAR", ELEMENT_ARRAY_BUFFER)
    buf.accessors[box_idx]["count"] *= 3

    rp, rj, rw, ri = bar()
    bar_pos = buf.add("3f", rp, FLOAT, "VEC3", ARRAY_BUFFER, bounds=True)
    bar_jnt = buf.add("4B", rj, UBYTE, "VEC4", ARRAY_BUFFER)
    bar_wgt = buf.add("4f", rw, FLOAT, "VEC4", ARRAY_BUFFER)
    bar_idx = buf.add("3H", ri, USHORT, "SCALAR", ELEMENT_ARRAY_BUFFER)
    buf.accessors[bar_idx]["count"] *= 3

    identity = (1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1)
    bone1_inverse = (1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1, 0, 0, -1, 0, 1)
    inverse_bind = buf.add("16f", [identity, bone1_inverse], FLOAT, "MAT4")

    times = buf.add("f", [(0.0,), (0.5,), (1.0,)], FLOAT, "SCALAR", bounds=True)
    bend = buf.add("4f", [quat_axis_angle((0, 0, 1), a) for a in (0, 40, 0)], FLOAT, "VEC4")
    lift = buf.add("3f", [(2.0, 0.0, 0.0), (2.0, 0.5, 0.0), (2.0, 0.0, 0.0)], FLOAT, "VEC3")

    gltf = {
        "asset": {"version": "2.0", "generator": "scene_assimp samples/make_sample.py"},
        "extensionsUsed": ["KHR_lights_punctual"],
        "extensions": {"KHR_lights_punctual": {"lights": [
            {"name": "Lamp", "type": "point", "color": [1.0, 0.9, 0.8], "intensity": 20.0,
             "range": 50.0}]}},
        "scene": 0,
        "scenes": [{"name": "Sample", "nodes": [0]}],
        "nodes": [
            {"name": "Root", "translation": [0.0, 0.5, 0.0], "children": [1, 3, 5, 6, 7]},
            {"name": "Pivot", "translation": [2.0, 0.0, 0.0],
             "rotation": list(quat_axis_angle((0, 1, 0), 45)), "children": [2]},
            {"name": "Box", "mesh": 0, "scale": [0.5, 0.5, 0.5]},
            {"name": "Mirror", "translation": [-2.0, 0.0, 0.0], "scale": [-1.0, 1.0, 1.0],
             "children": [4]},
            {"name": "BoxMirrored", "mesh": 0, "rotation": list(quat_axis_angle((1, 0, 0), 30))},
            {"name": "Camera", "camera": 0, "translation": [0.0, 2.0, 8.0],
             "rotation": list(quat_axis_angle((1, 0, 0), -10))},
            {"name": "Light", "translation": [3.0, 4.0, 2.0],
             "extensions": {"KHR_lights_punctual": {"light": 0}}},
            {"name": "Armature", "translation": [0.0, 0.0, -2.0], "children": [8, 10]},
            {"name": "Bone0", "children": [9]},
            {"name": "Bone1", "translation": [0.0, 1.0, 0.0]},
            {"name": "Bar", "mesh": 1, "skin": 0},
        ],
        "meshes": [
            {"name": "BoxMesh", "primitives": [{
                "attributes": {"POSITION": box_pos, "NORMAL": box_nrm, "TEXCOORD_0": box_uv},
                "indices": box_idx, "material": 0}]},
            {"name": "BarMesh", "primitives": [{
                "attributes": {"POSITION": bar_pos, "JOINTS_0": bar_jnt, "WEIGHTS_0": bar_wgt},
                "indices": bar_idx, "material": 0}]},
        ],
        "skins": [{"name": "BarSkin", "joints": [8, 9], "skeleton": 8,
                   "inverseBindMatrices": inverse_bind}],
        "materials": [{"name": "Checker", "pbrMetallicRoughness": {
            "baseColorFactor": [1.0, 1.0, 1.0, 1.0], "baseColorTexture": {"index": 0},
            "metallicFactor": 0.0, "roughnessFactor": 0.5}}],
        "textures": [{"sampler": 0, "source": 0}],
        "samplers": [{"magFilter": 9728, "minFilter": 9728, "wrapS": 10497, "wrapT": 33648}],
        "images": [{"uri": "checker.png"}],
        "cameras": [{"name": "View", "type": "perspective", "perspective": {
            "yfov": 0.8, "aspectRatio": 1.5, "znear": 0.1, "zfar": 100.0}}],
        "animations": [{"name": "Bend", "samplers": [
            {"input": times, "output": bend, "interpolation": "LINEAR"},
            {"input": times, "output": lift, "interpolation": "LINEAR"}],
            "channels": [
                {"sampler": 0, "target": {"node": 9, "path": "rotation"}},
                {"sampler": 1, "target": {"node": 1, "path": "translation"}}]}],
        "accessors": buf.accessors,
        "bufferViews": buf.views,
        "buffers": [{"uri": "sample.bin", "byteLength": len(buf.data)}],
    }
    return gltf, bytes(buf.data)


def dump(value, indent=0):
    """JSON with one member per line and short number lists kept on one line."""
    pad = "  " * indent
    if isinstance(value, dict):
        items = [f'{pad}  {json.dumps(k)}: {dump(v, indent + 1)}' for k, v in value.items()]
        return "{\n" + ",\n".join(items) + "\n" + pad + "}"
    if isinstance(value, list):
        if all(isinstance(v, (int, float)) for v in value):
            return json.dumps(value)
        return "[\n" + ",\n".join(pad + "  " + dump(v, indent + 1) for v in value) + "\n" + pad + "]"
    return json.dumps(value)


def main():
    gltf, data = build()
    with open(os.path.join(HERE, "sample.gltf"), "w", encoding="utf-8") as f:
        f.write(dump(gltf) + "\n")
    with open(os.path.join(HERE, "sample.bin"), "wb") as f:
        f.write(data)
    with open(os.path.join(HERE, "checker.png"), "wb") as f:
        f.write(checker_png())


if __name__ == "__main__":
    main()
