#!/usr/bin/python3
"""A client: makes room for a download."""
import sys

import spacekeep

WANTED = 20_000_000  # bytes

try:
    with spacekeep.Client() as client:
        answer = client.purge("/data", WANTED, urgency=2, finish_early=True, deadline_seconds=30)
except spacekeep.Error as error:
    sys.exit(f"make_room: {error}")
print(answer["SPACEKEEP_AMOUNT"], "bytes were freed")
sys.exit(answer["SPACEKEEP_AMOUNT"] < WANTED)
