"""C3D files for the tests: what the independent reader (the `c3d` package) sees in a file, the names
the reference page says the application gives its points and analog channels, and hand-made files
(built with numpy) for what the real files in data/c3d lack."""
import io
import struct
import warnings
from dataclasses import dataclass, field
from pathlib import Path

import numpy as np

import c3d

CORPUS = Path(__file__).resolve().parent.parent / "data" / "c3d"
OWN_GROUPS = ("POINT", "ANALOG", "TRIAL")
UNITS = {"": 1.0, "mm": 1.0, "cm": 10.0, "m": 1000.0}


class Reader(c3d.Reader):
    def get_analog_transform(self):
        # Limit of the reader: it reads ANALOG:SCALE and ANALOG:OFFSET even when a file has no analog
        # channels, and fails on the single values that sample_34 holds there. Nothing is scaled then.
        if self.analog_used == 0:
            return np.ones((0, 0)), np.zeros((0, 0))
        offset = self.get("ANALOG:OFFSET")
        if offset is not None and offset.bytes_per_element == 4:
            # Limit of the reader: it reads ANALOG:OFFSET as 16-bit integers only; sample_13 holds
            # floats (whole numbers), given to it as the integers they are.
            offset.bytes = offset.float_array.astype(self._dtypes.int16).tobytes()
            offset.bytes_per_element = 2
        return super().get_analog_transform()


def _whole_parameter_section(data):
    """Limit of the reader: it reads the parameter section only as far as the section's own block
    count says, which sample_13 understates (3 blocks, where its parameters run on to the data in
    block 8). It is given a copy whose count reaches the data."""
    start = (data[0] - 1) * 512
    big = data[start + 3] == 86
    data_block = struct.unpack(">H" if big else "<H", data[16:18])[0]
    if data_block - data[0] > data[start + 2]:
        data = bytearray(data)
        data[start + 2] = data_block - data[0]
    return bytes(data)


@dataclass
class Seen:
    """A file as the independent reader sees it; coordinates in millimetres."""
    labels: list
    rate: float
    first_frame: int
    xyz: np.ndarray        # frames x points x 3
    e: np.ndarray          # frames x points: seen
    analog: np.ndarray     # frames x channels x samples a frame, after the file's scaling
    analog_labels: list
    analog_units: list
    analog_rate: float
    groups: dict = field(default_factory=dict)  # name -> {parameter: (type, dims, values)}


def _values(reader, param):
    """A parameter's values whatever the file's processor form."""
    if param.bytes_per_element == 2:
        return np.frombuffer(param.bytes, dtype=reader._dtypes.int16).tolist()
    if param.bytes_per_element == 4:
        if reader._dtypes.is_dec:
            return c3d.c3d.DEC_to_IEEE_BYTES(param.bytes).tolist()
        return np.frombuffer(param.bytes, dtype=reader._dtypes.float32).tolist()
    return param.bytes


def _texts(reader, name):
    param = reader.get(name)
    return [] if param is None else [text.strip() for text in param.string_array]


def _fourth_words(reader, data, frames, points):
    """The raw fourth word of every sample of a float file (IEEE or MIPS form)."""
    words = np.frombuffer(data, dtype=reader._dtypes.uint32, offset=(reader.header.data_block - 1) * 512)
    per_frame = 4 * points + int(reader.analog_used) * reader.analog_per_frame
    return words[:frames * per_frame].reshape(frames, per_frame)[:, :4 * points].reshape(frames, points, 4)[:, :, 3]


def independent(path, strict=False):
    """Reads `path` with the independent reader. Strict, every warning of the reader is an error but
    those about a file without points or analog channels; else (for real files, which warn of their
    own inconsistencies) warnings are let pass."""
    data = _whole_parameter_section(Path(path).read_bytes())
    with warnings.catch_warnings(), io.BytesIO(data) as handle:
        warnings.simplefilter("error" if strict else "ignore")
        warnings.filterwarnings("ignore", "No analog data found")
        warnings.filterwarnings("ignore", "No point data found")
        reader = Reader(handle)
        points, analog = [], []
        for _, frame_points, frame_analog in reader.read_frames():
            points.append(frame_points.copy())
            analog.append(np.array(frame_analog, dtype=float))
    n = int(reader.point_used)
    points = np.array(points).reshape(len(points), n, 5)
    e = points[:, :, 3] >= 0
    if reader.point_scale < 0 and not reader._dtypes.is_dec and n:
        # Limit of the reader: it turns a float fourth word into a 32-bit integer, and 0x7F007F00
        # (1.7e38, a positive residual that sample_30 writes) overflows to a negative one.
        e |= _fourth_words(reader, data, len(points), n) == 0x7F007F00
    units = _texts(reader, "POINT:UNITS")
    factor = UNITS[units[0].lower() if units else ""]
    groups = {name: {pname: (p.bytes_per_element, list(p.dimensions), _values(reader, p)) for pname, p in group.param_items()}
              for name, group in reader.group_items() if name not in OWN_GROUPS}
    channels = int(reader.analog_used)
    analog = np.array(analog).reshape(len(points), channels, -1) if channels else np.zeros((len(points), 0, 0))
    return Seen(labels=_texts(reader, "POINT:LABELS")[:n], rate=float(reader.point_rate), first_frame=reader.first_frame,
                xyz=points[:, :, :3] * factor,
                e=e, analog=analog, analog_labels=_texts(reader, "ANALOG:LABELS")[:channels],
                analog_units=_texts(reader, "ANALOG:UNITS")[:channels], analog_rate=float(reader.analog_rate), groups=groups)


def _unique(base, taken):
    name, k = base, 2
    while name in taken:
        name, k = f"{base}_{k}", k + 1
    taken.add(name)
    return name


def point_names(labels):
    """(subject, marker) of each point by the reference page's rule: split at the last colon
    (Unlabeled without a subject), Point<N> for a blank marker, _2, _3, ... for a name given again,
    labelled points first."""
    split = []
    for label in labels:
        subject, colon, marker = label.rpartition(":")
        split.append((subject if colon and subject else "Unlabeled", marker))
    taken, names = set(), [None] * len(labels)
    for blank in (False, True):
        for i, (subject, marker) in enumerate(split):
            if (marker == "") == blank:
                base = marker or f"Point{i + 1}"
                names[i] = (subject, _unique(base, {m for s, m in taken if s == subject}))
                taken.add(names[i])
    return names


def analog_names(labels, taken):
    """The names of the analog channels: Analog<N> for a blank label, a suffix for a name taken under
    the root (`taken`: the names of the subjects and other objects there)."""
    taken = set(taken)
    return [_unique(label or f"Analog{i + 1}", taken) for i, label in enumerate(labels)]


# ---- Hand-made files: the Intel form ------------------------------------------------------------------

def _parameter(group, name, type_, dims, data, description=b""):
    body = struct.pack("<bB", type_, len(dims)) + bytes(dims) + data + bytes([len(description)]) + description
    return struct.pack("<bb", len(name), group) + name.encode() + struct.pack("<H", len(body) + 2) + body


def _texts_parameter(group, name, texts):
    texts = [t if isinstance(t, bytes) else t.encode() for t in texts]
    width = max([1] + [len(t) for t in texts])
    return _parameter(group, name, -1, [width, len(texts)], b"".join(t.ljust(width) for t in texts))


def build(points, labels, rate=100.0, units="mm", scale=-1.0, analog=None, analog_per_frame=1, offsets=None):
    """A C3D file: `points` frames x points x 4 (x, y, z, fourth word; int16 when scale > 0), labels
    (str, or bytes as they stand in the file) in parameters of 255 at most (LABELS, LABELS2, ...),
    `analog` frames x samples x channels; `offsets` gives ANALOG:OFFSET: as 16-bit unsigned integers,
    the samples unsigned too (ANALOG:FORMAT UNSIGNED), where each is one, else as floats."""
    frames, count = points.shape[:2]
    channels = 0 if analog is None else analog.shape[2]
    items = [struct.pack("<bb", 5, -1) + b"POINT" + struct.pack("<HB", 3, 0),
             _parameter(1, "USED", 2, [], struct.pack("<H", count)),
             _parameter(1, "SCALE", 4, [], struct.pack("<f", scale)),
             _parameter(1, "RATE", 4, [], struct.pack("<f", rate)),
             _parameter(1, "UNITS", -1, [len(units)], units.encode()),
             struct.pack("<bb", 5, -3) + b"TRIAL" + struct.pack("<HB", 3, 0),
             _parameter(3, "ACTUAL_START_FIELD", 2, [2], struct.pack("<HH", 1, 0)),
             _parameter(3, "ACTUAL_END_FIELD", 2, [2], struct.pack("<HH", frames & 0xFFFF, frames >> 16))]
    for part in range(0, max(count, 1), 255):
        items.append(_texts_parameter(1, "LABELS" + (str(part // 255 + 1) if part else ""), labels[part:part + 255]))
    if channels:
        items += [struct.pack("<bb", 6, -2) + b"ANALOG" + struct.pack("<HB", 3, 0),
                  _parameter(2, "USED", 2, [], struct.pack("<H", channels)),
                  _parameter(2, "RATE", 4, [], struct.pack("<f", rate * analog_per_frame)),
                  _texts_parameter(2, "LABELS", [f"EMG{c + 1}" for c in range(channels)])]
    unsigned = offsets is not None and all(o == int(o) and 0 <= o <= 65535 for o in offsets)
    if unsigned:
        items += [_parameter(2, "FORMAT", -1, [8], b"UNSIGNED"),
                  _parameter(2, "OFFSET", 2, [channels], struct.pack(f"<{channels}H", *offsets))]
    elif offsets is not None:
        items.append(_parameter(2, "OFFSET", 4, [channels], struct.pack(f"<{channels}f", *offsets)))
    section = b"".join(items) + b"\0\0"
    blocks = (4 + len(section) + 511) // 512
    section = (bytes([1, 0x50, blocks, 84]) + section).ljust(blocks * 512, b"\0")
    header = struct.pack("<BBHHHHHfHHf", 2, 0x50, count, channels * analog_per_frame, 1, min(frames, 65535), 0, scale,
                         2 + blocks, analog_per_frame, rate).ljust(512, b"\0")
    dtype = "<f4" if scale < 0 else "<i2"
    data = points.astype(dtype).reshape(frames, -1)
    if channels:
        samples = analog.astype("<u2" if unsigned else dtype).reshape(frames, -1)
        data = np.concatenate([data, samples.view(data.dtype)], axis=1)
    return header + section + data.tobytes()
