"""A storm of calls beside a model of the ports, in short. tests/soak/run lets it go on for longer.

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


def test_answers_files_signals_and_model_agree(device, tree, tmp_path):
    from storm import Soak

    soak = Soak(device, tree, tmp_path, SEED)
    try:
        soak.run(SECONDS)
        print(soak.table())
        assert soak.problems() == [], f"PORTD_TEST_SOAK_SEED={SEED}"
    finally:
        print(f"PORTD_TEST_SOAK_SEED={SEED}")
        soak.close()
