#!/usr/bin/python3
"""A service: gives up thumbnails, the oldest first; those of the last week at urgency 4 only."""
import pathlib
import time

import spacekeep


def files_for(job):
    latest = time.time() - (7 * 86400 if job.urgency < 4 else 0)
    paths = pathlib.Path("/data/thumbnails").iterdir() if job.volume == "/data" else []
    files = [(path.stat().st_mtime, path.stat().st_size, path) for path in paths]
    return sorted(file for file in files if file[0] <= latest)


class Thumbnails(spacekeep.Service):
    def purgeable(self, job):
        return sum(size for _, size, _ in files_for(job))

    def purge(self, job):
        freed = 0
        for _, size, path in files_for(job):
            if freed >= job.amount or job.cancelled():
                break
            path.unlink()
            freed += size
        return freed


spacekeep.serve("org.example.thumbnails", Thumbnails())
