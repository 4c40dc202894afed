"""A storm of calls on everything at once, in short: the daemon lives through it and is no bigger afterwards.

tests/soak/run lets it go on for longer, and compares every answer with a model of the ports, whose idea of
what calls that meet may bring about is still too narrow now and then.

PORTD_TEST_SOAK is the number of seconds, and PORTD_TEST_SOAK_SEED the storm: a failure says which it was.
"""

import os
import random
import sys
from pathlib import Path

import pytest

from gpio_tree import device_on_lines

sys.path.append(str(Path(__file__).resolve().parents[1] / "soak"))

SECONDS = float(os.environ.get("PORTD_TEST_SOAK", "30"))
SEED = int(os.environ.get("PORTD_TEST_SOAK_SEED", random.randrange(10**6)))

device = pytest.fixture(device_on_lines)


def test_a_storm_is_lived_through_and_nothing_grows(device, tree, tmp_path):
    from storm import Soak

    soak = Soak(device, tree, tmp_path, SEED)
    try:
        soak.run(SECONDS)
        print(soak.table())
        assert soak.growth() == [], f"PORTD_TEST_SOAK_SEED={SEED}"
    finally:
        print(f"PORTD_TEST_SOAK_SEED={SEED}")
        soak.close()
