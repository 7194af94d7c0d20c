# SPDX-License-Identifier: Apache-2.0
"""Runs the trials; scripts/trials/servers prepares and calls it. Exit code 1 when a check failed."""
import argparse
import sys

from common import Trials, make_keys, scratch
from ds389 import trials_of_389
from slapd import trials_of_slapd

SERVERS = {"slapd": trials_of_slapd, "389": trials_of_389}


def main():
    parser = argparse.ArgumentParser(prog="scripts/trials/servers")
    parser.add_argument("--short", action="store_true", help="less load, fewer rounds")
    parser.add_argument("server", nargs="*", help="slapd, 389, or both when none is named")
    options = parser.parse_args()
    if unknown := set(options.server) - set(SERVERS):
        parser.error(f"there is no {unknown.pop()}")
    trials = Trials()
    for name in options.server or SERVERS:
        with scratch() as folder:
            SERVERS[name](trials, folder, make_keys(folder), options.short)
    print(f"{trials.passed} passed, {trials.failed} failed")
    return 1 if trials.failed else 0


if __name__ == "__main__":
    sys.exit(main())
