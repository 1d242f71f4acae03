"""Compares our property lists with those of Python's standard library, in both directions and both forms.

usage: cross_check.py PLIST_ECHO [SEED [COUNT]]

Trees are generated from a seed, which every failure names.
"""

import datetime
import math
import plistlib
import random
import struct
import subprocess
import sys
import unittest

ECHO = sys.argv[1]
SEED = int(sys.argv[2]) if len(sys.argv) > 2 else random.SystemRandom().randrange(1 << 32)
COUNT = int(sys.argv[3]) if len(sys.argv) > 3 else 120
FORMS = {"xml": plistlib.FMT_XML, "binary": plistlib.FMT_BINARY}
DEEPEST = 128
REFERENCE = datetime.datetime(2001, 1, 1)


class Echo:
    """Our reader and one of our writers, in a process of their own."""

    def __init__(self, form):
        self.process = subprocess.Popen(
            [ECHO, form], stdin=subprocess.PIPE, stdout=subprocess.PIPE, stderr=subprocess.PIPE)

    def __call__(self, document):
        self.process.stdin.write(struct.pack(">Q", len(document)) + document)
        self.process.stdin.flush()
        size = struct.unpack(">Q", self.process.stdout.read(8))[0]
        if size == 0:
            raise ValueError(self.process.stderr.readline().decode().strip())
        return self.process.stdout.read(size)

    def close(self):
        self.process.stdin.close()
        assert self.process.wait() == 0
        self.process.stdout.close()
        self.process.stderr.close()


class Generator:
    ALPHABETS = [
        "abcdefghijklmnopqrstuvwxyz ABC/.-_0123456789",
        "<>&\"']]>\t\n",
        "\u00e4\u00df\u0416\u05d0\u0939\u20ac\ufffd\ud7ff\ue000\u2028",
        "\U00010000\U0001f600\U0010ffff\U0002f800",
    ]
    INTEGERS = [0, 1, -1, 127, 128, 255, 256, 65535, 65536, 2**31, 2**32 - 1, 2**32, -(2**31), 2**63 - 1,
                -(2**63), -(2**63) + 1]
    # Only one zero: Python's binary writer takes 0.0 and -0.0 in one document for the same.
    REALS = [-0.0, 0.1, 1e300, -1e-300, 5e-324, 1.7976931348623157e308, math.inf, -math.inf, 1e22]
    SIZES = [0, 1, 2, 3, 14, 15, 16, 56, 57, 58, 255, 256, 1000, 70000]

    def __init__(self, seed):
        self.random = random.Random(seed)

    def text(self):
        alphabet = "".join(self.random.sample(self.ALPHABETS, self.random.randint(1, len(self.ALPHABETS))))
        length = self.random.choice([0, 1, 5, 14, 15, 16, 40, 300])
        return "".join(self.random.choices(alphabet, k=length))

    def date(self):
        # Whole seconds: all that the XML form has.
        seconds = self.random.choice([
            0, 1, -1, 978307200, 253402300799, -62135596800, self.random.randint(-62135596800, 253402300799)])
        return datetime.datetime(1970, 1, 1) + datetime.timedelta(seconds=seconds)

    def data(self):
        return self.random.randbytes(self.random.choice(self.SIZES[:-1] if self.random.random() < 0.95
                                                        else self.SIZES))

    def integer(self):
        if self.random.random() < 0.5:
            return self.random.choice(self.INTEGERS)
        return self.random.randint(-(2**63), 2**63 - 1) >> self.random.randint(0, 63)

    def real(self):
        if self.random.random() < 0.5:
            return self.random.choice(self.REALS)
        while True:
            real = struct.unpack(">d", self.random.randbytes(8))[0]
            if not math.isnan(real):
                return real

    def scalar(self):
        return self.random.choice([
            lambda: self.random.random() < 0.5, self.integer, self.real, self.text, self.data, self.date])()

    def container(self, depth):
        count = self.random.choice([0, 1, 2, 3, 5, 14, 15, 16, 40] if depth < 3 else [0, 1, 2])
        elements = [self.tree(depth + 1) for _ in range(count)]
        if self.random.random() < 0.4:
            return elements
        return {self.text(): element for element in elements}

    def tree(self, depth=0):
        chance = 0.95 if depth == 0 else 0.4 if depth < 4 else 0.1
        return self.container(depth) if self.random.random() < chance else self.scalar()

    def deep(self):
        value = self.scalar()
        for _ in range(DEEPEST):
            value = [value] if self.random.random() < 0.5 else {self.text(): value}
        return value


def exact(value):
    """A value that is equal only to the same kinds: in Python True, 1 and 1.0 are alike, 0.0 and -0.0 too."""
    if isinstance(value, dict):
        return ("dictionary", sorted((key, exact(member)) for key, member in value.items()))
    if isinstance(value, list):
        return ("array", [exact(element) for element in value])
    if isinstance(value, float):
        return ("real", struct.pack(">d", value))
    return (type(value).__name__, value)


class CrossCheck(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.echoes = {form: Echo(form) for form in FORMS}

    @classmethod
    def tearDownClass(cls):
        for echo in cls.echoes.values():
            echo.close()

    def check(self, value, what):
        """Written by Python, read by us, written by us, read by Python: in every combination of forms."""
        for written, theirs in FORMS.items():
            document = plistlib.dumps(value, fmt=theirs)
            for ours, echo in self.echoes.items():
                with self.subTest(what, seed=SEED, read=written, written=ours):
                    returned = echo(document)
                    self.assertEqual(exact(plistlib.loads(returned, fmt=FORMS[ours])), exact(value))
                    # Ours, read by us and written again, is the same to the byte.
                    self.assertEqual(echo(returned), returned)

    def test_generated_trees(self):
        for index in range(COUNT):
            self.check(Generator(SEED + index).tree(), f"tree {index}")

    def test_generated_trees_at_the_depth_limit(self):
        for index in range(10):
            self.check(Generator(SEED + index).deep(), f"deep tree {index}")

    def test_every_special_scalar(self):
        generator = Generator(SEED)
        self.check(generator.INTEGERS, "integers")
        self.check(generator.REALS, "reals")
        self.check(0.0, "zero")
        self.check([bytes(size) for size in generator.SIZES], "data")
        self.check(["x" * size for size in generator.SIZES], "text")
        self.check(["\u20ac" * size for size in generator.SIZES], "text that is not ASCII")
        self.check([list(range(size)) for size in generator.SIZES], "arrays")
        self.check({str(key): key for key in range(70000)}, "large dictionary")

    def test_carriage_returns(self):
        # Python writes them plainly, so that its own XML loses them; ours must not.
        document = plistlib.dumps(["a\r\nb\r"], fmt=plistlib.FMT_BINARY)
        for form, echo in self.echoes.items():
            self.assertEqual(plistlib.loads(echo(document)), ["a\r\nb\r"], form)

    def test_fractions_of_a_second_in_the_binary_form(self):
        generator = Generator(SEED)
        for _ in range(100):
            seconds = generator.random.randint(-(2**35), 2**35) + generator.random.randint(0, 7) / 8
            date = REFERENCE + datetime.timedelta(seconds=seconds)
            document = plistlib.dumps(date, fmt=plistlib.FMT_BINARY)
            self.assertEqual(plistlib.loads(self.echoes["binary"](document)), date, SEED)

    def test_beyond_the_limits(self):
        for value in (2**63, 2**64 - 1, [2**63]):
            for written in FORMS.values():
                for echo in self.echoes.values():
                    with self.assertRaisesRegex(ValueError, "beyond 64 bits"):
                        echo(plistlib.dumps(value, fmt=written))
        deep = []
        for _ in range(DEEPEST):
            deep = [deep]
        for written in FORMS.values():
            with self.assertRaisesRegex(ValueError, "nested too deeply"):
                self.echoes["xml"](plistlib.dumps(deep, fmt=written))

    def test_objects_without_a_kind_of_ours(self):
        with self.assertRaisesRegex(ValueError, "a kind that is not supported"):
            self.echoes["xml"](plistlib.dumps(plistlib.UID(1), fmt=plistlib.FMT_BINARY))


if __name__ == "__main__":
    print(f"seed {SEED}", file=sys.stderr)
    unittest.main(argv=sys.argv[:1])
