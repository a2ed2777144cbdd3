"""The drivers through rasterio, rioxarray and dask: blocks, windows, chunks that threads read at the
same time; and the example of a cluster on a small archive, one image of which is damaged."""
import csv
import os
import re
import subprocess
import sys
import warnings

import numpy
import rasterio
import rioxarray
from rasterio.windows import Window

import images
from images import FEW, Kind

EXAMPLE = os.path.join(images.DATA, '..', '..', 'examples', 'archive_statistics.py')
SCENES = FEW + [Kind('VITec', 3, 'u1', (64, 32), shape=(300, 200)),
                Kind('Helava', 3, shape=(300, 200), order='<')]


class Packages(images.ImageTest):
    def test_windows(self):
        for kind in SCENES:
            samples = kind.samples()
            path = kind.write(self.path('x' + kind.extension), samples)
            with self.subTest(kind.name), rasterio.open(path) as scene:
                block = kind.tile if kind.tile[0] else (1, kind.shape[1])
                self.assertEqual([block] * kind.nbands, scene.block_shapes)
                pieces = numpy.zeros_like(samples)
                for _, window in scene.block_windows(1):
                    pieces[(slice(None), *window.toslices())] = scene.read(window=window)
                self.assertSamples(samples, pieces)
                padded = numpy.pad(samples, ((0, 0), (5, 5), (7, 7)), constant_values=9)
                self.assertSamples(padded, scene.read(boundless=True, fill_value=9, window=Window(
                    -7, -5, padded.shape[2], padded.shape[1])))
                profile = scene.profile
            copy = self.path('y' + kind.extension)
            with self.subTest(kind.name), rasterio.open(copy, 'w', **profile) as made:
                made.write(samples)
            with rasterio.open(copy, 'r+') as made:
                made.write(samples[:, 3:20, 4:30] // 2, window=Window(4, 3, 26, 17))
            expected = samples.copy()
            expected[:, 3:20, 4:30] //= 2
            with self.subTest(kind.name), rasterio.open(copy) as found:
                self.assertSamples(expected, found.read())

    def test_chunks_of_threads(self):
        for kind in SCENES:
            samples = kind.samples()
            path = kind.write(self.path('x' + kind.extension), samples)
            height, width = kind.tile if kind.tile[0] else (16, kind.shape[1])
            chunks = {'band': 1, 'y': height, 'x': width}
            with self.subTest(kind.name), \
                    rioxarray.open_rasterio(path, chunks=chunks, lock=False) as scene:
                self.assertEqual(height, scene.data.chunksize[1])
                self.assertSamples(samples, scene.compute(scheduler='threads',
                                                          num_workers=8).values)
                self.assertAlmostEqual(samples.mean(), float(scene.mean().compute()), 3)

    def test_archive_on_a_cluster(self):
        scenes = {}
        for number, kind in enumerate(SCENES):
            name = '%d%s' % (number, kind.extension)
            scenes[name] = kind.samples(seed=number)
            content = kind.content(scenes[name])
            images.write_file(self.path(name), content[:1500] if number == 3 else content)
        table, damaged = self.path('table.csv'), '3' + SCENES[3].extension
        run = subprocess.run([sys.executable, EXAMPLE, self.folder, '--table=' + table],
                             check=False, timeout=200, capture_output=True, text=True)
        self.assertEqual(1, run.returncode, run.stderr)
        self.assertRegex(run.stderr, re.escape(damaged) + '.* is missing')
        with open(table, encoding='utf-8') as file:
            found = {(os.path.basename(row['file']), int(row['band'])): float(row['mean'])
                     for row in csv.DictReader(file)}
        expected = {(name, band): samples[band].mean() for name, samples in scenes.items()
                    if name != damaged for band in range(len(samples))}
        self.assertEqual(expected.keys(), found.keys())
        for key, mean in expected.items():
            self.assertAlmostEqual(mean, found[key], 6)


if __name__ == '__main__':
    warnings.simplefilter('ignore')  # of images without georeferencing
    images.main()
