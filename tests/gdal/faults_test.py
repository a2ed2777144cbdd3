"""Files that are truncated or damaged, copies that are cancelled, full disks, many data sets, and
threads."""
import os
import random
import re
import resource
import struct
import threading
import unittest

import numpy
from osgeo import gdal

import images
from images import Errors, FEW, Kind, VITEC_DATA_OFFSET

# A few hundred bytes each, so that every length and every disk size can be tried.
SMALL = [Kind('VITec', 1, shape=(5, 11)), Kind('VITec', 2, 'u2', shape=(4, 7), order='<'),
         Kind('VITec', 2, 'u1', (8, 8), shape=(13, 9)),
         Kind('VITec', 1, 'u2', (8, 16), shape=(9, 17)), Kind('Helava', 3, shape=(5, 7))]


def offsets_of(kind):
    """Returns where each sample [band, line, sample] ends in a file."""
    shape = (kind.nbands,) + kind.shape
    index = numpy.arange(1, numpy.prod(shape) + 1, dtype='u4').reshape(shape)
    order = numpy.frombuffer(kind.pixels(index) if kind.driver == 'VITec' else index.tobytes(), 'u4')
    ends = numpy.zeros(index.size + 1, int)
    ends[order] = numpy.arange(1, order.size + 1) * kind.dtype.itemsize
    return ends[1:].reshape(shape) + (VITEC_DATA_OFFSET if kind.driver == 'VITec' else 0)


class Damage(images.ImageTest):
    def test_truncated_at_every_byte(self):
        for kind in SMALL:
            samples, ends = kind.samples(), offsets_of(kind)
            content, path = kind.content(samples), self.memory + '/x' + kind.extension
            for length in range(len(content)):
                images.write_file(path, content[:length])
                with self.subTest(kind.name, length=length), Errors() as errors:
                    file = gdal.Open(path)
                    if file is None:
                        self.assertTrue(errors.failures())
                        self.assertTrue(length < VITEC_DATA_OFFSET or kind.driver == 'Helava')
                        continue
                    for band in range(kind.nbands):
                        for line in range(kind.shape[0]):
                            self.check_line(file, path, samples, ends <= length, band, line)
                    self.check_whole(file, samples, ends <= length)
                    file = None
                    self.assertIsNone(gdal.Open(path, gdal.GA_Update))
                    self.assertIn(path, errors.failures()[-1])
                    self.assertEqual(content[:length], images.read_file(path))

    def check_line(self, file, path, samples, present, band, line):
        before = numpy.full((1, samples.shape[2]), 77, samples.dtype)
        found = before.copy()
        with Errors() as errors:
            read = file.GetRasterBand(band + 1).ReadAsArray(0, line, samples.shape[2], 1,
                                                            buf_obj=found)
        if read is None:
            self.assertTrue((before == found).all())
            self.assertIn(path, errors.failures()[-1])
            self.assertRegex(errors.failures()[-1], r'line %d of band %d\b' % (line, band + 1))
        else:
            self.assertTrue(present[band, line].all())
            self.assertSamples(samples[band, line], found[0])

    def check_whole(self, file, samples, present):
        """All bands at once, as they are, converted and resampled: right, or left alone."""
        for dtype, shape in ((samples.dtype, samples.shape), (numpy.dtype('f8'), samples.shape),
                             (samples.dtype, (samples.shape[0], 2, 3))):
            before = numpy.full(shape, 77, dtype)
            found = before.copy()
            with Errors() as errors:
                read = file.ReadAsArray(0, 0, samples.shape[2], samples.shape[1],
                                        buf_obj=found if shape[0] > 1 else found[0])
            if read is None:
                self.assertTrue(errors.failures())
                self.assertTrue((before == found).all())
            elif shape == samples.shape:
                self.assertTrue(present.all())
                self.assertSamples(samples.astype(dtype), found)

    def test_truncated_while_open(self):
        """Whatever is asked for: an error that names the line, and the destination left alone."""
        for kind in FEW:
            for access in (gdal.GA_ReadOnly, gdal.GA_Update):
                for dtype in (kind.dtype, numpy.dtype('f8')):
                    path = kind.write(self.path('x' + kind.extension), kind.samples())
                    file = gdal.Open(path, access)
                    os.truncate(path, 1000)
                    before = numpy.full((kind.nbands,) + kind.shape, 77, dtype)
                    found = before.copy()
                    with self.subTest(kind.name, access=access, dtype=dtype), \
                            self.refused(kind.driver, path, 'line'):
                        self.assertIsNone(file.ReadAsArray(buf_obj=found))
                        self.assertTrue((before == found).all())

    def test_hostile_headers(self):
        """Random words: a data set that can be asked for samples, or an error."""
        chance = random.Random(1)
        words = [0, 1, 2, 3, 7, 8, 9, 255, 32768, 65535, 65544, 0x7fffffff, 0x80000000, 0xffffffff,
                 0x40000000, 46341]
        opened = 0
        for turn in range(1500):
            kind = SMALL[turn % len(SMALL)]
            content = bytearray(kind.content(kind.samples()))
            places = range(112, 180, 4) if kind.driver == 'VITec' else \
                range(len(content) - 16, len(content), 4)
            for _ in range(chance.randint(1, 3)):
                place = chance.choice([*places, 4] if kind.driver == 'VITec' else places)
                struct.pack_into(kind.order + 'I', content, place, chance.choice(
                    words + [chance.getrandbits(32), chance.randint(0, 300)]))
            path = self.memory + '/x' + kind.extension
            images.write_file(path, bytes(content))
            for access in (gdal.GA_ReadOnly, gdal.GA_Update):
                with self.subTest(turn, access=access), Errors() as errors:
                    file = gdal.Open(path, access)
                    self.assertTrue(file is not None or errors.failures())
                    if file is None:
                        continue
                    opened += 1
                    for number in {1, file.RasterCount}:
                        band = file.GetRasterBand(number)
                        for samp, line in ((0, 0), (file.RasterXSize - 1, file.RasterYSize - 1)):
                            errors.clear()
                            self.assertTrue(band.ReadAsArray(samp, line, 1, 1) is not None or
                                            errors.failures())
                    file = None
            self.assertEqual(bytes(content), images.read_file(path))
            gdal.Unlink(path)
        self.assertGreater(opened, 300)


class Unfinished(images.ImageTest):
    def test_cancelled_copies(self):
        for kind in FEW:
            for folder in (self.folder, self.memory):
                for stop in (0, 0.1, 0.5, 0.99):
                    path = folder + '/x' + kind.extension
                    with self.subTest(kind.name, folder=folder, stop=stop), \
                            self.refused('terminated'):
                        source = images.memory_copy(kind.samples())
                        source.SetMetadata({'a': 'b'})
                        self.assertIsNone(gdal.GetDriverByName(kind.driver).CreateCopy(
                            path, source, 1, kind.options(),
                            callback=lambda done, _text, _data: done < stop))
                    self.assertEqual([], [name for name in gdal.ReadDir(folder) or []
                                          if name not in ('.', '..')])

    def test_source_that_fails(self):
        """A copy of a truncated file is an error and leaves none."""
        kind = FEW[0]
        images.write_file(self.path('cut.img'), kind.content(kind.samples())[:3000])
        for driver in ('VITec', 'Helava'):
            with self.refused('cut.img', 'line'):
                self.assertIsNone(gdal.GetDriverByName(driver).CreateCopy(
                    self.path('y'), gdal.Open(self.path('cut.img'))))
            self.assertEqual(['cut.img'], os.listdir(self.folder))

    def make(self, kind, way, path):
        """Makes an image in one of three ways; returns the failures."""
        samples, driver = kind.samples(), gdal.GetDriverByName(kind.driver)
        with Errors() as errors:
            if way == 'copy':
                made = driver.CreateCopy(path, images.memory_copy(samples), 1, kind.options())
            else:
                made = driver.Create(path, kind.shape[1], kind.shape[0], kind.nbands,
                                     gdal.GDT_Byte if kind.dtype == 'u1' else gdal.GDT_UInt16,
                                     kind.options())
                if made is not None:
                    fresh = samples if way == 'direct' else samples.astype('f8')
                    made.WriteArray(fresh if kind.nbands > 1 else fresh[0])
            made = None
        return errors.failures()

    def test_full_disk_in_memory(self):
        for kind in SMALL:
            if kind.order == '<':
                continue
            size = len(kind.content(kind.samples()))
            for way in ('copy', 'direct', 'cached'):
                for room in range(size + 2):
                    path = self.memory + '/x||maxlength=%d||' % room
                    with self.subTest(kind.name, way=way, room=room):
                        failures = self.make(kind, way, path)
                        if room < size:
                            self.assertTrue(failures)
                            self.assertIsNone(gdal.VSIStatL(path))
                        else:
                            self.assertEqual([], failures)
                            self.assertSamples(kind.samples(), images.bands_of(gdal.Open(path)))
                    gdal.Unlink(path)

    def test_full_disk(self):
        """On a local disk, by way of the limit of file sizes."""
        limits = resource.getrlimit(resource.RLIMIT_FSIZE)
        for kind in SMALL:
            if kind.order == '<':
                continue
            size = len(kind.content(kind.samples()))
            for way in ('copy', 'direct', 'cached'):
                for room in (0, 3, 47, 100, 243, 244, size // 2, size - 17, size - 1, size):
                    path = self.path('x' + kind.extension)
                    resource.setrlimit(resource.RLIMIT_FSIZE, (room, limits[1]))
                    try:
                        failures = self.make(kind, way, path)
                    finally:
                        resource.setrlimit(resource.RLIMIT_FSIZE, limits)
                    with self.subTest(kind.name, way=way, room=room):
                        self.assertEqual(room < size, bool(failures), failures)
                        self.assertEqual(room < size, not os.path.exists(path))

    def test_places_that_take_no_file(self):
        kind = FEW[0]
        for path in (self.path('missing/x.img'), '/vsicurl/http://127.0.0.1:1/x.img',
                     self.folder, '/proc/x.img'):
            for driver in ('VITec', 'Helava'):
                with self.subTest(path, driver=driver), Errors() as errors:
                    self.assertIsNone(gdal.GetDriverByName(driver).Create(path, 9, 9))
                    self.assertIsNone(gdal.GetDriverByName(driver).CreateCopy(
                        path, images.memory_copy(kind.samples())))
                    self.assertIn(driver, errors.failures()[-1])
        self.assertEqual([], os.listdir(self.folder))


class Many(images.ImageTest):
    def descriptors(self):
        return len(os.listdir('/proc/self/fd'))

    def test_two_hundred_at_once(self):
        for folder in (self.folder, self.memory):
            for kind in FEW:
                paths = ['%s/%d%s' % (folder, i, kind.extension) for i in range(200)]
                for i, path in enumerate(paths):
                    kind.write(path, kind.samples(seed=i))
                files = [gdal.Open(path, i % 2) for i, path in enumerate(paths)]
                for i, file in enumerate(files):
                    self.assertSamples(kind.samples(seed=i), images.bands_of(file))
                    file.SetGeoTransform((i * 53, 1, 0, 0, 0, -1))
                file = files = None
                mosaic = gdal.BuildVRT('', paths, resolution='highest')
                self.assertSamples(numpy.concatenate([kind.samples(seed=i) for i in range(200)], 2),
                                   images.bands_of(mosaic))

    def test_nothing_leaks(self):
        cases = [(kind.write(folder + '/x' + kind.extension, kind.samples()), kind)
                 for kind in FEW for folder in (self.folder, self.memory)]
        images.write_file(self.path('cut.img'), cases[0][1].content(cases[0][1].samples())[:150])
        before = self.descriptors()
        for turn in range(500):
            path, kind = cases[turn % len(cases)]
            file = gdal.Open(path, turn % 2)
            file.GetRasterBand(1).ReadAsArray(0, 0, 5, 5)
            file = None
            with Errors():
                self.assertIsNone(gdal.Open(self.path('cut.img'), turn % 2))
        self.assertEqual(before, self.descriptors())

    def test_eight_threads(self):
        wrong = []

        def work(number):
            kind = FEW[number % len(FEW)]
            folder = (self.folder, self.memory)[number // 3 % 2]
            path = '%s/%d%s' % (folder, number, kind.extension)
            try:
                with Errors() as errors:
                    for turn in range(30):
                        samples = kind.samples(seed=number * 100 + turn)
                        copy = gdal.GetDriverByName(kind.driver).CreateCopy(
                            path, images.memory_copy(samples), 1, kind.options())
                        copy = None
                        file = gdal.Open(path, gdal.GA_Update)
                        self.assertSamples(samples, images.bands_of(file))
                        samples[:, 3:9, 5:25] = 7
                        for band in range(kind.nbands):
                            file.GetRasterBand(band + 1).WriteArray(samples[band, 3:9, 5:25], 5, 3)
                        file = None
                        self.assertSamples(samples.astype('f4'), numpy.stack(
                            [gdal.Open(path).ReadAsArray(buf_type=gdal.GDT_Float32)]).reshape(
                                samples.shape))
                        # errors belong to the thread that made them
                        self.assertEqual([], errors.failures())
                        self.assertIsNone(gdal.GetDriverByName(kind.driver).Create(
                            path + str(number), 9, 9, 77777))
                        self.assertIn(path + str(number), errors.failures()[0])
                        errors.clear()
            except Exception as error:  # pylint: disable=broad-except
                wrong.append(error)

        threads = [threading.Thread(target=work, args=(number,)) for number in range(8)]
        for thread in threads:
            thread.start()
        for thread in threads:
            thread.join()
        self.assertEqual([], wrong)

    def test_errors_name_the_driver(self):
        for kind in FEW:
            path = self.path('x' + kind.extension)
            content = kind.content(kind.samples())
            if kind.driver == 'VITec':
                images.write_file(path, content[:148] + b'\xff\xff\xff\xff' + content[152:])
            else:
                images.write_file(path, content[:-12] + b'\xff\xff\xff\xff' + content[-8:])
            with self.subTest(kind.name), self.refused(kind.driver, path) as errors:
                self.assertIsNone(gdal.Open(path))
            self.assertFalse([text for _, text in errors if re.search(r'img_|!!', text)])


if __name__ == '__main__':
    images.main()
