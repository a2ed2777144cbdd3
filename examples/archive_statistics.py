#!/usr/bin/python3
"""Statistics of all VITec and Helava images of an archive, computed by a Dask cluster.

The numbers are those of `imgfile stats --json`, to the last digit. The images are read through
GDAL, so every worker needs the plugin of this project, and the archive under the same name: a
folder, or any path of GDAL (/vsis3/bucket/scenes). Debian packages: libgdal-imgfile, python3-gdal,
python3-numpy, python3-distributed, python3-matplotlib.
"""

import argparse
import csv
import fnmatch
import importlib.util
import math
import os
import sys
import time

import numpy as np
from distributed import Client, KilledWorker, as_completed
from osgeo import gdal

DRIVERS = ["VITec", "Helava"]
STATED_BITS = {1: 8, 2: 12}  # by bytes of a sample
PIECE = 1 << 20  # samples that are read at a time; more where one row of tiles has more
IMAGES_PER_TASK = 16
COLUMNS = ["file", "lines", "samples", "band", "minimum", "maximum", "mean", "standard_deviation",
           "share_of_zero", "stated_bits", "beyond_stated_bits"]


# --- On the workers ---

def count_values(band):
    """Returns how often each value occurs in the band."""
    nbytes = 2 if band.DataType == gdal.GDT_UInt16 else 1
    counts = np.zeros(256 ** nbytes, np.int64)
    width, height, block = band.XSize, band.YSize, band.GetBlockSize()[1]
    step = max(1, PIECE // (width * block)) * block
    for line in range(0, height, step):
        samples = band.ReadAsArray(0, line, width, min(step, height - line))
        counts += np.bincount(samples.ravel(), minlength=counts.size)
    return counts


def facts_of(counts):
    """Returns what `imgfile stats` computes from these counts, by the same steps of rounding."""
    bits = STATED_BITS[1 if counts.size == 256 else 2]
    values = np.flatnonzero(counts)
    numbers = counts[values]
    total = int(numbers.sum())
    mean = int((values * numbers).sum()) / total
    distances = values - mean
    squares = np.cumsum(distances * distances * numbers)[-1]  # cumsum adds in order, sum does not
    return {"minimum": int(values[0]), "maximum": int(values[-1]), "mean": mean,
            "standard_deviation": math.sqrt(squares / total),
            "share_of_zero": int(counts[0]) / total, "stated_bits": bits,
            "beyond_stated_bits": int(counts[1 << bits:].sum())}


def measure(path):
    """Returns the rows of an image, one for each band."""
    image = gdal.OpenEx(path, gdal.OF_RASTER | gdal.OF_VERBOSE_ERROR, allowed_drivers=DRIVERS)
    size = {"file": path, "lines": image.RasterYSize, "samples": image.RasterXSize}
    return [{**size, "band": band, **facts_of(count_values(image.GetRasterBand(band + 1)))}
            for band in range(image.RasterCount)]


def measure_all(paths):
    """Returns the rows of all images, and for each damaged one its path and what is wrong."""
    gdal.UseExceptions()
    gdal.SetConfigOption("GDAL_PAM_ENABLED", "NO")  # side files are not needed, nor looked for
    gdal.SetConfigOption("GDAL_DISABLE_READDIR_ON_OPEN", "EMPTY_DIR")
    rows, faults = [], []
    for path in paths:
        try:
            rows += measure(path)
        except Exception as fault:  # whatever an image does, the others are measured
            faults.append((path, " ".join(str(fault).split()) or type(fault).__name__))
    return rows, faults


# --- Here ---

def list_images(roots, patterns):
    """Returns the sorted paths of all files below the roots whose names match a pattern."""
    paths = set()
    for root in roots:
        status = gdal.VSIStatL(root)
        if status is not None and not status.IsDirectory():
            paths.add(root)
            continue
        below = gdal.ReadDirRecursive(root)
        if below is None:
            sys.exit(f"{root}: there is no such folder or file")
        paths.update(f"{root.rstrip('/')}/{name}" for name in below
                     if any(fnmatch.fnmatch(name.lower(), each) for each in patterns))
    return sorted(paths)


def show_progress(done, total, nfaults, start):
    rate = done / (time.monotonic() - start)
    text = (f"{done:,} of {total:,} images, {nfaults} damaged, {rate:,.0f} images/s, "
            f"{(total - done) / rate:.0f} s left")
    ending = "\n" if done == total or not sys.stderr.isatty() else "\r"
    print(text.ljust(78), end=ending, file=sys.stderr, flush=True)


def measure_archive(client, paths):
    """Spreads the images over the cluster. Returns all rows and all faults."""
    tasks = {}  # the paths of each future

    def submit(groups):
        futures = client.map(measure_all, groups, pure=False)
        tasks.update(zip(futures, groups))
        return futures

    rows, faults = [], []
    done, start, shown = 0, time.monotonic(), 0.0
    results = as_completed(submit([paths[i:i + IMAGES_PER_TASK]
                                   for i in range(0, len(paths), IMAGES_PER_TASK)]))
    for future in results:
        group = tasks.pop(future)
        try:
            more_rows, more_faults = future.result()
        except KilledWorker:  # several times: find out by which image
            if len(group) > 1:
                results.update(submit([[path] for path in group]))
                continue
            more_rows, more_faults = [], [(group[0], "ends each process that reads it")]
        rows += more_rows
        faults += more_faults
        done += len(group)
        if done == len(paths) or time.monotonic() - shown >= 1:
            shown = time.monotonic()
            show_progress(done, len(paths), len(faults), start)
    return sorted(rows, key=lambda row: (row["file"], row["band"])), sorted(faults)


def write_table(rows, path):
    if path.endswith(".parquet"):
        import pandas
        pandas.DataFrame(rows, columns=COLUMNS).to_parquet(path, index=False)
        return
    with open(path, "w", newline="", encoding="utf-8", errors="surrogateescape") as file:
        writer = csv.DictWriter(file, COLUMNS, lineterminator="\n")
        writer.writeheader()
        writer.writerows(rows)


def draw_picture(rows, path):
    """Draws a dot for each band: images that are empty, dark or saturated lie apart."""
    import matplotlib
    matplotlib.use("Agg")
    from matplotlib import pyplot
    figure, axes = pyplot.subplots(1, 2, layout="constrained", figsize=(12, 4.5))
    for bits, plot in zip(STATED_BITS.values(), axes):
        chosen = [row for row in rows if row["stated_bits"] == bits]
        dots = plot.scatter([row["mean"] for row in chosen],
                            [row["standard_deviation"] for row in chosen], s=8,
                            c=[100 * row["share_of_zero"] for row in chosen], vmin=0, vmax=100)
        plot.set(title=f"{len(chosen):,} bands of {bits} bits", xlabel="mean",
                 ylabel="standard deviation", xlim=(0, None), ylim=(0, None))
        figure.colorbar(dots, ax=plot, label="zero samples, %")
    figure.savefig(path, dpi=100)


def parse_arguments():
    parser = argparse.ArgumentParser(
        description="Computes statistics of all VITec and Helava images of an archive on several "
        "processes or machines. The exit status is 0, or 1 if an image is damaged: its name is "
        "printed, and all others are in the table.")
    parser.add_argument("archive", nargs="+",
                        help="a folder or an image; also a path of GDAL, such as /vsis3/...")
    parser.add_argument("--table", required=True, metavar="FILE",
                        help="the table to write, one row for each band: .csv or .parquet")
    parser.add_argument("--picture", metavar="FILE.png",
                        help="a picture of the mean and the deviation of each band")
    parser.add_argument("--names", default="*.img,*.d", metavar="PATTERNS",
                        help="the names of images, in lower case (default: %(default)s)")
    parser.add_argument("--workers", type=int, default=2, metavar="N",
                        help="processes to start on this machine (default: %(default)s)")
    parser.add_argument("--scheduler", metavar="ADDRESS",
                        help="use the Dask cluster at this address, such as tcp://host:8786")
    options = parser.parse_args()
    if os.path.splitext(options.table)[1] not in (".csv", ".parquet"):
        parser.error(f"{options.table}: the name must end in .csv or .parquet")
    if options.table.endswith(".parquet") and not (
            importlib.util.find_spec("pandas") and
            any(map(importlib.util.find_spec, ("pyarrow", "fastparquet")))):
        parser.error(f"{options.table}: needs the Python packages pandas and pyarrow")
    return options


def main():
    options = parse_arguments()
    paths = list_images(options.archive, options.names.split(","))
    if not paths:
        sys.exit(f"{' '.join(options.archive)}: no images of the names {options.names}")
    try:
        client = Client(options.scheduler) if options.scheduler else Client(
            n_workers=options.workers, threads_per_worker=1, dashboard_address=None)
    except OSError as fault:
        sys.exit(f"{options.scheduler}: {fault}")
    with client:
        rows, faults = measure_archive(client, paths)
    write_table(rows, options.table)
    if options.picture:
        draw_picture(rows, options.picture)
    for path, fault in faults:
        print(fault if path in fault else f"{path}: {fault}", file=sys.stderr)
    return 1 if faults else 0


if __name__ == "__main__":
    sys.exit(main())
