#!/usr/bin/python3
"""The service of the documentation, but at a handed-over socket."""
import runpy

import spacekeep

spacekeep.serve = lambda _, service: spacekeep.serve_listening(service, stop_when_idle_seconds=60)
runpy.run_path("/source/sdk/examples/thumbnails.py")
