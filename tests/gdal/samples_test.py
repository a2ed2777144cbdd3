"""Reads, updates, creates and copies files of every kind, and compares every sample with numpy or
with the same samples in memory."""
import unittest

import numpy
from osgeo import gdal

import images
from images import KINDS, WRITTEN, Kind

# samp, line, nsamps, nlines
WINDOWS = [(0, 0, 53, 37), (0, 0, 1, 1), (52, 36, 1, 1), (7, 15, 2, 2), (3, 5, 41, 29), (0, 8, 53, 1),
           (16, 0, 1, 37)]


class Golden(images.ImageTest):
    def test_golden_files(self):
        for name, dtype, (nbands, nlines, nsamps), block in (
                ('untiled_8bit.img', 'u1', (1, 37, 53), [53, 1]),
                ('untiled_3bands_little.img', 'u1', (3, 20, 31), [31, 1]),
                ('tiled_3bands.img', 'u1', (3, 37, 53), [8, 16]),
                ('untiled_16bit.img', 'u2', (1, 29, 41), [41, 1]),
                ('tiled_16bit_little.img', 'u2', (2, 29, 41), [32, 8]),
                ('long_header.img', 'u1', (1, 9, 11), [11, 1]),
                ('helava_2bands.d', 'u1', (2, 23, 35), [35, 1]),
                ('helava_little.d', 'u1', (1, 23, 35), [35, 1])):
            band, line, samp = numpy.ogrid[:nbands, :nlines, :nsamps]
            expected = (band * 101 + line * 31 + samp * 7) % 251 if dtype == 'u1' else \
                (band * 501 + line * 13 + samp * 3) % 4096
            with self.subTest(name):
                dataset = gdal.Open(images.DATA + '/' + name)
                self.assertSamples(expected.astype(dtype), images.bands_of(dataset))
                self.assertEqual(block, dataset.GetRasterBand(1).GetBlockSize())
                self.assertIsNone(dataset.GetRasterBand(1).GetMetadataItem(
                    'NBITS', 'IMAGE_STRUCTURE'))


class Reading(images.ImageTest):
    def check(self, kind, request):
        """The file and a copy in memory must answer `request` alike."""
        samples = kind.samples()
        for path in (self.path('x' + kind.extension), self.memory + '/x' + kind.extension):
            with self.subTest(kind.name, path=path):
                file = gdal.Open(kind.write(path, samples))
                self.assertEqual(kind.driver, file.GetDriver().ShortName)
                self.assertSamples(request(images.memory_copy(samples)), request(file))

    def test_windows(self):
        for kind in KINDS:
            for window in WINDOWS:
                self.check(kind, lambda image: image.ReadAsArray(*window))

    def test_band_sets_and_strides(self):
        def spaced(image, nsamps=20, nlines=11, **spaces):
            size = image.GetRasterBand(1).DataType
            bands = [1 + i % image.RasterCount for i in (2, 0, 1, 2)]
            result = numpy.zeros(60000, 'u1')
            raw = image.ReadRaster(9, 3, nsamps, nlines, band_list=bands,
                                   **{key: value * size for key, value in spaces.items()})
            result[:len(raw)] = numpy.frombuffer(raw, 'u1')
            return result
        for kind in KINDS:
            self.check(kind, lambda image: spaced(image))
            self.check(kind, lambda image: spaced(image, buf_pixel_space=4, buf_line_space=80,
                                                  buf_band_space=1))
            self.check(kind, lambda image: spaced(image, buf_pixel_space=3, buf_line_space=70,
                                                  buf_band_space=900))

    def test_resampled_converted_and_fractional(self):
        for kind in KINDS:
            for method in (gdal.GRIORA_NearestNeighbour, gdal.GRIORA_Bilinear,
                           gdal.GRIORA_Average):
                self.check(kind, lambda image: image.ReadAsArray(
                    4, 2, 40, 30, buf_xsize=13, buf_ysize=17, resample_alg=method))
                self.check(kind, lambda image: image.GetRasterBand(1).ReadAsArray(
                    3.5, 2.25, 20.5, 10.75, 20, 10, resample_alg=method))
            for dtype in (gdal.GDT_Byte, gdal.GDT_Int16, gdal.GDT_Float64, gdal.GDT_CFloat32):
                self.check(kind, lambda image: image.ReadAsArray(2, 3, 30, 20, buf_type=dtype))

    def test_blocks(self):
        for kind in KINDS:
            samples = kind.samples()
            with self.subTest(kind.name):
                file = gdal.Open(kind.write(self.path('x' + kind.extension), samples))
                height, width = kind.tile if kind.tile[0] else (1, kind.shape[1])
                padded = numpy.pad(samples, ((0, 0), (0, -37 % height), (0, -53 % width)))
                for band in range(kind.nbands):
                    for line, samp in ((0, 0), (36 // height, 52 // width)):
                        raw = file.GetRasterBand(band + 1).ReadBlock(samp, line)
                        block = padded[band, line * height:(line + 1) * height,
                                       samp * width:(samp + 1) * width]
                        self.assertSamples(block, numpy.frombuffer(
                            raw, kind.dtype).reshape(height, width))


class Writing(images.ImageTest):
    def test_update_of_any_window(self):
        for kind in KINDS:
            expected = kind.samples()
            path = kind.write(self.memory + '/x' + kind.extension, expected)
            header = images.read_file(path)
            for turn, (samp, line, nsamps, nlines) in enumerate(WINDOWS[1:]):
                fresh = kind.samples(seed=turn + 2)[:, :nlines, :nsamps]
                expected[:, line:line + nlines, samp:samp + nsamps] = fresh
                file = gdal.Open(path, gdal.GA_Update)
                if turn % 2:  # by blocks of the cache, converted
                    file.WriteArray(fresh.astype('f8') if kind.nbands > 1 else
                                    fresh[0].astype('f8'), samp, line)
                else:
                    for band in range(kind.nbands):
                        file.GetRasterBand(band + 1).WriteArray(fresh[band], samp, line)
                with self.subTest(kind.name, turn=turn):
                    self.assertSamples(expected, images.bands_of(file))
                    file = None
                    self.assertSamples(expected, images.bands_of(gdal.Open(path)))
            # all bytes: headers, the order of the words, the padding of tiles
            with self.subTest(kind.name):
                self.assertEqual(kind.content(expected), images.read_file(path))
                self.assertEqual(len(header), len(images.read_file(path)))

    def test_cached_and_direct_writes_in_turns(self):
        for kind in WRITTEN:
            path = kind.write(self.path('x' + kind.extension), kind.samples())
            file, model = gdal.Open(path, gdal.GA_Update), images.memory_copy(kind.samples())
            for turn in range(12):
                fresh = kind.samples(seed=turn)[0, :9, :11]
                for image in (file, model):
                    image.GetRasterBand(1).WriteArray(
                        fresh if turn % 3 else fresh.astype('f4'), turn * 3, turn * 2)
                    image.GetRasterBand(1).ReadAsArray(0, 0, 20, 20, 10, 10)
            with self.subTest(kind.name):
                self.assertSamples(images.bands_of(model), images.bands_of(file))
                file = None
                self.assertSamples(images.bands_of(model), images.bands_of(gdal.Open(path)))

    def test_create_writes_every_byte(self):
        """What is written equals the file of the model, but for the date and the length word."""
        for kind in WRITTEN:
            for folder in (self.folder, self.memory):
                path = folder + '/x' + kind.extension
                samples = kind.samples()
                file = gdal.GetDriverByName(kind.driver).Create(
                    path, 53, 37, kind.nbands, gdal.GDT_Byte if kind.dtype == 'u1' else
                    gdal.GDT_UInt16, kind.options())
                file.WriteArray(samples if kind.nbands > 1 else samples[0])
                file = None
                with self.subTest(kind.name, path=path):
                    self.assertSamples(samples, images.bands_of(gdal.Open(path)))
                    found, expected = images.read_file(path), kind.content(samples)
                    if kind.driver == 'VITec':
                        found, expected = ([each[:16], each[22:116], each[120:]]
                                           for each in (found, expected))
                    self.assertTrue(expected == found)

    def test_unwritten_samples_read_0(self):
        for kind in WRITTEN:
            path = self.memory + '/x' + kind.extension
            file = gdal.GetDriverByName(kind.driver).Create(
                path, 53, 37, kind.nbands, gdal.GDT_Byte if kind.dtype == 'u1' else
                gdal.GDT_UInt16, kind.options())
            file.GetRasterBand(kind.nbands).WriteArray(numpy.full((2, 3), 9, kind.dtype), 20, 17)
            file = None
            expected = numpy.zeros((kind.nbands, 37, 53), kind.dtype)
            expected[-1, 17:19, 20:23] = 9
            with self.subTest(kind.name):
                self.assertSamples(expected, images.bands_of(gdal.Open(path)))

    def test_copies(self):
        for kind in WRITTEN:
            for source_kind in (kind, Kind('VITec', kind.nbands, kind.dtype, (16, 32))):
                samples = source_kind.samples()
                source = images.memory_copy(samples) if source_kind is kind else gdal.Open(
                    source_kind.write(self.path('source.img'), samples)) \
                    if kind.nbands < 4 else None
                if source is None:
                    continue
                path, steps = self.path('copy' + kind.extension), []
                copy = gdal.GetDriverByName(kind.driver).CreateCopy(
                    path, source, 1, kind.options(),
                    callback=lambda done, _text, _data: steps.append(done) or 1)
                with self.subTest(kind.name):
                    self.assertSamples(samples, images.bands_of(copy))
                    copy = None
                    self.assertSamples(samples, images.bands_of(gdal.Open(path)))
                    self.assertEqual(steps, sorted(steps))
                    self.assertEqual(1.0, steps[-1])


if __name__ == '__main__':
    images.main()
