"""What the tests of the GDAL drivers share: files of every kind, put together byte by byte from
numpy arrays; errors of GDAL; and a runner that fails for anything on the standard error stream."""
import contextlib
import itertools
import os
import struct
import sys
import tempfile
import unittest

import numpy
from osgeo import gdal

gdal.DontUseExceptions()
DATA = os.path.join(os.path.dirname(os.path.abspath(__file__)), '..', 'data')
VITEC_DATA_OFFSET = 244
HELAVA_TRAILER = 16


class Kind:
    """One way in which a format stores an image. `tile` is (lines, samples); (0, 0): untiled."""

    def __init__(self, driver, nbands, dtype='u1', tile=(0, 0), order='>', shape=(37, 53)):
        self.driver, self.nbands, self.tile, self.order = driver, nbands, tile, order
        self.dtype, self.shape = numpy.dtype(dtype), shape
        self.name = '%s_%dbands_%s%s_%s' % (
            driver, nbands, dtype, '_tiles%dx%d' % tile if tile != (0, 0) else '',
            {'>': 'big', '<': 'little'}[order])
        self.extension = '.img' if driver == 'VITec' else '.d'

    def options(self):
        if self.tile == (0, 0):
            return []
        return ['TILED=YES', 'BLOCKYSIZE=%d' % self.tile[0], 'BLOCKXSIZE=%d' % self.tile[1]]

    def samples(self, seed=1):
        """Returns samples [band, line, sample] of the whole range of values."""
        most = numpy.iinfo(self.dtype).max
        return numpy.random.default_rng(seed).integers(
            0, most, (self.nbands,) + self.shape, self.dtype, endpoint=True)

    def content(self, samples):
        """Returns the bytes of a file with these samples."""
        stored = samples.astype(self.dtype.newbyteorder(self.order))
        if self.driver == 'Helava':
            return stored.tobytes() + struct.pack(self.order + '4I', stored.shape[0],
                                                  stored.shape[2], stored.shape[1], 0x48411484)
        return self.vitec_header(stored.shape) + self.pixels(stored)

    def vitec_header(self, shape, header_length=132):
        order, (nbands, nlines, nsamps) = self.order, shape
        file_block = struct.pack(order + '4I', 0x005B0720, 108, 0, 0) + bytes(16) + \
            b'VITec'.ljust(16, b'\0')
        image_block = struct.pack(order + '2I16x10I4x', header_length, 0, 7, 0, 0, nsamps, nlines,
                                  self.tile[1], self.tile[0], int(nbands < 3), nbands,
                                  self.dtype.itemsize - 1)
        return file_block + bytes(64) + image_block + bytes(64)

    def pixels(self, stored):
        height, width = self.tile
        if self.tile == (0, 0):
            return stored.tobytes()
        stored = numpy.pad(stored, ((0, 0), (0, -stored.shape[1] % height),
                                    (0, -stored.shape[2] % width)))
        nbands, nlines, nsamps = stored.shape
        tiles = stored.reshape(nbands, nlines // height, height, nsamps // width, width)
        return tiles.transpose(1, 3, 0, 2, 4).tobytes()

    def write(self, path, samples):
        write_file(path, self.content(samples))
        return path


KINDS = [Kind('VITec', nbands, dtype, tile, order)
         for nbands, dtype, tile, order in itertools.product(
             (1, 2, 3), ('u1', 'u2'), ((0, 0), (16, 8), (8, 64)), '><')] + \
        [Kind('Helava', nbands, order=order) for nbands in (1, 2, 3, 4, 5) for order in '><']
# Kinds that the drivers write, of one or of several bands.
WRITTEN = [kind for kind in KINDS if kind.order == '>']
FEW = [Kind('VITec', 3), Kind('VITec', 2, 'u2', (16, 8)), Kind('Helava', 2)]


def write_file(path, content):
    handle = gdal.VSIFOpenL(path, 'wb')
    assert handle is not None, path
    gdal.VSIFWriteL(content, 1, len(content), handle)
    gdal.VSIFCloseL(handle)


def read_file(path):
    status = gdal.VSIStatL(path)
    handle = gdal.VSIFOpenL(path, 'rb')
    content = bytes(gdal.VSIFReadL(1, status.size, handle)) if status.size else b''
    gdal.VSIFCloseL(handle)
    return content


def memory_copy(samples):
    """Returns a data set in memory with these samples."""
    nbands, nlines, nsamps = samples.shape
    copy = gdal.GetDriverByName('MEM').Create(
        '', nsamps, nlines, nbands, gdal.GDT_UInt16 if samples.dtype == 'u2' else gdal.GDT_Byte)
    copy.WriteArray(samples)
    return copy


def bands_of(dataset):
    """Returns the samples of a data set as [band, line, sample], whatever its number of bands."""
    return numpy.stack([dataset.GetRasterBand(band + 1).ReadAsArray()
                        for band in range(dataset.RasterCount)])


class Errors(list):
    """Errors and warnings of GDAL on this thread, as (class, text), while the block runs."""

    def __enter__(self):
        gdal.ErrorReset()
        gdal.PushErrorHandler(lambda level, number, text: self.append((level, text)))
        return self

    def __exit__(self, *_):
        gdal.PopErrorHandler()
        gdal.ErrorReset()

    def failures(self):
        return [text for level, text in self if level >= gdal.CE_Failure]


class ImageTest(unittest.TestCase):
    def setUp(self):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        self.folder = folder.name
        self.memory = '/vsimem/' + self.id()
        gdal.Mkdir(self.memory, 0o755)
        self.addCleanup(gdal.RmdirRecursive, self.memory)

    def path(self, name):
        return os.path.join(self.folder, name)

    @contextlib.contextmanager
    def refused(self, *words):
        """The block must report a failure that has all the words."""
        with Errors() as errors:
            yield errors
        self.assertTrue(errors.failures(), 'no error')
        for word in words:
            self.assertIn(word, ' | '.join(errors.failures()))

    def assertSamples(self, expected, found):
        self.assertIsNotNone(found)
        self.assertEqual(expected.shape, found.shape)
        self.assertTrue((expected == found).all(), '%d samples differ' % (expected != found).sum())


def main():
    """Runs the tests of the script. What is printed on the standard error stream fails them."""
    with tempfile.TemporaryFile() as printed:
        terminal = os.dup(2)
        os.dup2(printed.fileno(), 2)
        drivers = [gdal.GetDriverByName(name) for name in ('VITec', 'Helava')]
        runner = unittest.TextTestRunner(stream=sys.stdout, verbosity=1)
        passed = None not in drivers and \
            unittest.main(module='__main__', testRunner=runner, exit=False).result.wasSuccessful()
        os.dup2(terminal, 2)
        printed.seek(0)
        text = printed.read().decode(errors='replace')
    if None in drivers:
        print('GDAL found no drivers in', os.environ.get('GDAL_DRIVER_PATH'))
    if text:
        print('on the standard error stream:', text, sep='\n')
    sys.stdout.flush()
    sys.exit(not passed or bool(text))
