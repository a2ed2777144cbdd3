"""What can be created: bands and types, creation options, side files of metadata, and the files that
belong to a data set."""
import os
import unittest

import numpy
from osgeo import gdal, osr

import images
from images import Errors, FEW, Kind

MOST_BANDS = {'VITec': 3, 'Helava': 5}
TYPES = {'VITec': (gdal.GDT_Byte, gdal.GDT_UInt16), 'Helava': (gdal.GDT_Byte,)}
ALL_TYPES = [each for each in range(1, gdal.GDT_TypeCount) if gdal.GetDataTypeName(each)]


class Types(images.ImageTest):
    def test_create(self):
        """0 to 5 bands of every type: the file is made, or an error says what cannot be stored."""
        for driver, types in TYPES.items():
            for nbands in range(6):
                for each in ALL_TYPES:
                    path = self.memory + '/x'
                    holds = 1 <= nbands <= MOST_BANDS[driver] and each in types
                    with self.subTest(driver, nbands=nbands, type=gdal.GetDataTypeName(each)), \
                            Errors() as errors:
                        made = gdal.GetDriverByName(driver).Create(path, 7, 5, nbands, each)
                        self.assertEqual(holds, made is not None)
                        if holds:
                            self.assertEqual([], errors)
                            self.assertEqual((nbands, each),
                                             (made.RasterCount, made.GetRasterBand(1).DataType))
                        else:
                            # GDAL itself may refuse first
                            self.assertRegex(errors.failures()[-1], 'bands?|samples of type')
                            self.assertIsNone(gdal.VSIStatL(path))
                        made = None
                        gdal.Unlink(path)

    def test_copy(self):
        """A strict copy is exact or refused; another one clips samples, and says so."""
        for driver, types in TYPES.items():
            for nbands in range(6):
                for each in ALL_TYPES:
                    source = gdal.GetDriverByName('MEM').Create('', 7, 5, nbands, each)
                    for band in range(nbands):
                        source.GetRasterBand(band + 1).WriteArray(
                            numpy.linspace(-400, 70000, 35).reshape(5, 7))
                    for strict in (1, 0):
                        path = self.memory + '/x'
                        with self.subTest(driver, nbands=nbands, strict=strict,
                                          type=gdal.GetDataTypeName(each)), Errors() as errors:
                            copy = gdal.GetDriverByName(driver).CreateCopy(path, source, strict)
                            exact = each in types
                            holds = 1 <= nbands <= MOST_BANDS[driver] and (exact or not strict)
                            self.assertEqual(holds, copy is not None)
                            if holds:
                                stored = each if exact else types[-1]
                                self.assertEqual(stored, copy.GetRasterBand(1).DataType)
                                self.assertSamples(
                                    source.ReadAsArray(buf_type=stored), copy.ReadAsArray())
                                self.assertEqual([] if exact else [gdal.CE_Warning],
                                                 [level for level, _ in errors])
                            else:
                                self.assertRegex(errors.failures()[-1], driver)
                                self.assertIsNone(gdal.VSIStatL(path))
                            copy = None
                            gdal.Unlink(path)

    def test_sizes(self):
        for driver, size, options, holds in (
                ('VITec', (1, 1), [], True), ('VITec', (1, 1), ['TILED=YES'], True),
                ('Helava', (1, 1), [], True),
                ('VITec', (46341, 46341), [], False), ('Helava', (46341, 46341), [], False),
                ('VITec', (2147483647, 1), [], False), ('VITec', (1, 2147483647), [], False),
                ('VITec', (2147483647, 2147483647), ['TILED=YES'], False),
                ('VITec', (65537, 32767), ['BLOCKXSIZE=32768'], False)):
            path = self.memory + '/x'
            with self.subTest(driver, size=size, options=options), Errors() as errors:
                made = gdal.GetDriverByName(driver).Create(path, *size, 1, gdal.GDT_Byte, options)
                self.assertEqual((holds, not holds),
                                 (made is not None, bool(errors.failures())))
                self.assertEqual(holds, gdal.VSIStatL(path) is not None)
                made = None
                gdal.Unlink(path)

    def test_masks_are_copied(self):
        for kind in FEW:
            for flags in (gdal.GMF_PER_DATASET, 0):
                source, path = images.memory_copy(kind.samples()), self.path('x' + kind.extension)
                for number in range(1, kind.nbands + 1):
                    band = source.GetRasterBand(number)
                    band.CreateMaskBand(flags)
                    band.GetMaskBand().WriteArray(kind.samples(seed=number)[0] % 2 * 255)
                with self.subTest(kind.name, flags=flags), Errors() as errors:
                    gdal.GetDriverByName(kind.driver).CreateCopy(path, source, 1)
                    found = gdal.Open(path)
                    self.assertEqual([], errors)
                    self.assertEqual(flags, found.GetRasterBand(1).GetMaskFlags())
                    for number in range(1, kind.nbands + 1):
                        self.assertSamples(source.GetRasterBand(number).GetMaskBand().ReadAsArray(),
                                           found.GetRasterBand(number).GetMaskBand().ReadAsArray())
                    found = None
                gdal.GetDriverByName(kind.driver).Delete(path)


class Options(images.ImageTest):
    def test_tiles(self):
        vitec = gdal.GetDriverByName('VITec')
        for options, block in (([], [600, 1]), (['TILED=NO'], [600, 1]),
                               (['TILED=YES'], [256, 256]), (['BLOCKXSIZE=64'], [64, 256]),
                               (['BLOCKYSIZE=1'], [600, 1]),  # as rasterio hands on a profile
                               (['BLOCKXSIZE=600', 'BLOCKYSIZE=1'], [600, 1]),
                               (['TILED=NO', 'BLOCKXSIZE=64'], [600, 1]),
                               (['TILED=TRUE', 'BLOCKXSIZE=16', 'BLOCKYSIZE=1024'], [16, 1024]),
                               (['BLOCKXSIZE=32768', 'BLOCKYSIZE=8'], [32768, 8])):
            with self.subTest(options), Errors() as errors:
                made = vitec.Create(self.memory + '/x', 600, 300, 1, gdal.GDT_Byte, options)
                self.assertEqual(block, made.GetRasterBand(1).GetBlockSize())
                self.assertEqual([], errors)
                made = None
                found = gdal.Open(self.memory + '/x')
                self.assertEqual(block, found.GetRasterBand(1).GetBlockSize())
                found = None
                gdal.Unlink(self.memory + '/x')

    def test_bad_values(self):
        vitec = gdal.GetDriverByName('VITec')
        for value in ('0', '-8', '1', '7', '4', '100', '65536', '65544', '4294967304', 'wide', '',
                      '64x', '8.5'):
            for key in ('BLOCKXSIZE', 'BLOCKYSIZE'):
                path = self.memory + '/x'
                with self.subTest(key, value=value), Errors() as errors:
                    self.assertIsNone(vitec.Create(path, 60, 30, 1, gdal.GDT_Byte,
                                                   ['TILED=YES', key + '=' + value]))
                    self.assertIn(key, errors.failures()[-1])
                    self.assertIsNone(gdal.VSIStatL(path))

    def test_list_of_options(self):
        """GDAL validates by the list: it warns of other options, and of values of another type."""
        for driver, options in (('VITec', ['COMPRESS=LZW']), ('Helava', ['TILED=YES']),
                                ('VITec', ['TILED=PERHAPS'])):
            with self.subTest(options), Errors() as errors:
                self.assertIsNotNone(gdal.GetDriverByName(driver).Create(
                    self.memory + '/x', 9, 9, 1, gdal.GDT_Byte, options))
                self.assertIn(options[0].split('=')[0], errors[0][1])
                gdal.Unlink(self.memory + '/x')


def describe(image):
    """Gives a data set everything that the formats themselves do not hold."""
    reference = osr.SpatialReference()
    reference.ImportFromEPSG(32633)
    image.SetGeoTransform((500000.5, 10, 0.25, 4e6, -0.125, -9))
    image.SetProjection(reference.ExportToWkt())
    image.SetMetadata({'SENSOR': 'a "b" <c>', 'DAY': '1'})
    image.SetMetadata({'a': 'b'}, 'OTHER')
    for number in range(1, image.RasterCount + 1):
        band = image.GetRasterBand(number)
        band.SetNoDataValue(number)
        band.SetDescription('band %d' % number)
        band.SetMetadata({'GAIN': str(number)})
        band.SetMetadata({'c': str(number)}, 'OTHER')
        band.SetScale(2)
        band.SetOffset(number)
        band.SetUnitType('m')
        band.SetCategoryNames(['water', 'land'])
        band.SetColorInterpretation((gdal.GCI_BlueBand, gdal.GCI_AlphaBand)[number % 2])


def description(image):
    return (image.GetGeoTransform(), image.GetSpatialRef().ExportToWkt(),
            image.GetMetadataItem('SENSOR'), image.GetMetadataItem('DAY'),
            image.GetMetadata('OTHER'),
            [(band.GetNoDataValue(), band.GetDescription(), band.GetMetadataItem('GAIN'),
              band.GetMetadata('OTHER'), band.GetScale(), band.GetOffset(), band.GetUnitType(),
              band.GetCategoryNames(),
              band.GetColorInterpretation())
             for band in map(image.GetRasterBand, range(1, image.RasterCount + 1))])


class SideFiles(images.ImageTest):
    def test_text_of_the_header(self):
        """A copy keeps it in its own header, and needs no side file for it."""
        for order in '><':
            kind = Kind('VITec', 1, order=order)
            content = bytearray(kind.content(kind.samples()))
            content[16:22], content[120:125] = bytes((126, 10, 9, 8, 7, 6)), b'north'
            images.write_file(self.path('x.img'), bytes(content))
            for source, copy in (('x.img', 'y.img'), ('y.img', 'z.img')):
                gdal.GetDriverByName('VITec').CreateCopy(self.path(copy),
                                                         gdal.Open(self.path(source)))
                self.assertEqual({'DESCRIPTION': 'north', 'CREATION_DATE': '2026-11-09T08:07:06'},
                                 gdal.Open(self.path(copy)).GetMetadata('VITEC'))
                self.assertEqual({}, gdal.Open(self.path(copy)).GetMetadata())
            self.assertEqual(['x.img', 'y.img', 'z.img'], sorted(os.listdir(self.folder)))

    def test_metadata_comes_back(self):
        for kind in FEW:
            path = self.path('x' + kind.extension)
            source = images.memory_copy(kind.samples())
            describe(source)
            with self.subTest(kind.name, way='copy'):
                copy = gdal.GetDriverByName(kind.driver).CreateCopy(path, source, 1, kind.options())
                self.assertEqual(description(source), description(copy))
                copy = None
                self.assertEqual(description(source), description(gdal.Open(path)))
                self.assertSamples(kind.samples(), images.bands_of(gdal.Open(path)))
                gdal.GetDriverByName(kind.driver).Delete(path)
                self.assertEqual([], os.listdir(self.folder))
            for access in (gdal.GA_ReadOnly, gdal.GA_Update):
                with self.subTest(kind.name, way='open', access=access):
                    kind.write(path, kind.samples())
                    image = gdal.Open(path, access)
                    describe(image)
                    image = None
                    self.assertEqual(description(source), description(gdal.Open(path)))
                    self.assertEqual(kind.content(kind.samples()), images.read_file(path))
                    os.remove(path + '.aux.xml')
                    os.remove(path)

    def test_ground_control_points(self):
        for kind in FEW:
            source = images.memory_copy(kind.samples())
            source.SetGCPs([gdal.GCP(1 + i, 2 * i, i, 3 * i, 4 + i * i) for i in range(4)],
                           osr.SpatialReference(osr.SRS_WKT_WGS84_LAT_LONG).ExportToWkt())
            path = self.path('x' + kind.extension)
            gdal.GetDriverByName(kind.driver).CreateCopy(path, source)
            with self.subTest(kind.name):
                found = gdal.Open(path)
                self.assertEqual([(p.GCPX, p.GCPY, p.GCPZ, p.GCPPixel, p.GCPLine)
                                  for p in source.GetGCPs()],
                                 [(p.GCPX, p.GCPY, p.GCPZ, p.GCPPixel, p.GCPLine)
                                  for p in found.GetGCPs()])
                self.assertEqual(source.GetGCPSpatialRef().ExportToWkt(),
                                 found.GetGCPSpatialRef().ExportToWkt())

    def test_colour_table(self):
        for driver in TYPES:
            source, path = gdal.GetDriverByName('MEM').Create('', 7, 5), self.memory + '/x'
            colours = gdal.ColorTable()
            colours.SetColorEntry(3, (1, 2, 3, 4))
            source.GetRasterBand(1).SetColorTable(colours)
            gdal.GetDriverByName(driver).CreateCopy(path, source, 1)
            found = gdal.Open(path)
            self.assertEqual((1, 2, 3, 4), found.GetRasterBand(1).GetColorTable().GetColorEntry(3))
            self.assertEqual(gdal.GCI_PaletteIndex, found.GetRasterBand(1).GetColorInterpretation())

    def test_colour_interpretation(self):
        gray, none = gdal.GCI_GrayIndex, gdal.GCI_Undefined
        for kind, expected in (
                (Kind('VITec', 1), [gray]), (Kind('VITec', 1, 'u2'), [gray]),
                (Kind('VITec', 2), [none] * 2), (Kind('VITec', 3, 'u2'), [none] * 3),
                (Kind('VITec', 3), [gdal.GCI_RedBand, gdal.GCI_GreenBand, gdal.GCI_BlueBand]),
                (Kind('Helava', 1), [gray]), (Kind('Helava', 4), [none] * 4),
                (Kind('Helava', 3), [gdal.GCI_RedBand, gdal.GCI_GreenBand, gdal.GCI_BlueBand])):
            file = gdal.Open(kind.write(self.path('x' + kind.extension), kind.samples()))
            with self.subTest(kind.name):
                self.assertEqual(expected, [file.GetRasterBand(i + 1).GetColorInterpretation()
                                            for i in range(kind.nbands)])

    def test_statistics_overviews_masks(self):
        for kind in (Kind('VITec', 3, 'u2', (16, 8), shape=(300, 200)),
                     Kind('Helava', 2, shape=(300, 200))):
            samples = kind.samples()
            path = kind.write(self.path('x' + kind.extension), samples)
            model = images.memory_copy(samples)
            for image in (gdal.Open(path), model):
                image.BuildOverviews('NEAREST', [2, 4])
            file = gdal.Open(path)
            with self.subTest(kind.name):
                for number in range(1, kind.nbands + 1):
                    band, same = file.GetRasterBand(number), model.GetRasterBand(number)
                    self.assertEqual(same.ComputeStatistics(False), band.ComputeStatistics(False))
                    self.assertEqual(same.Checksum(), band.Checksum())
                    self.assertEqual(same.GetHistogram(approx_ok=0), band.GetHistogram(approx_ok=0))
                    self.assertEqual(2, band.GetOverviewCount())
                    for i in range(2):
                        self.assertSamples(same.GetOverview(i).ReadAsArray(),
                                           band.GetOverview(i).ReadAsArray())
                file.CreateMaskBand(gdal.GMF_PER_DATASET)
                file.GetRasterBand(1).GetMaskBand().WriteArray(samples[0] % 2 * 255)
                minimum = file.GetRasterBand(1).GetStatistics(0, 0)
                file = None
                again = gdal.Open(path)
                self.assertEqual(minimum, again.GetRasterBand(1).GetStatistics(0, 0))
                self.assertSamples(samples[0] % 2 * 255,
                                   again.GetRasterBand(1).GetMaskBand().ReadAsArray())
                self.assertEqual({path + end for end in ('', '.ovr', '.msk', '.aux.xml')},
                                 set(again.GetFileList()))
                self.assertEqual(kind.content(samples), images.read_file(path))

    def test_reading_writes_no_side_file(self):
        for kind in FEW:
            path = kind.write(self.path('x' + kind.extension), kind.samples())
            file = gdal.Open(path)
            images.bands_of(file)
            file.ReadAsArray(0, 0, 53, 37, buf_xsize=5, buf_ysize=5)
            gdal.Info(path, format='json')
            for number in range(kind.nbands):
                file.GetRasterBand(number + 1).ComputeRasterMinMax(False)
                file.GetRasterBand(number + 1).Checksum()
            file = None
            file = gdal.Open(path, gdal.GA_Update)
            file.GetRasterBand(1).WriteArray(kind.samples()[0])
            file = None
            self.assertEqual([os.path.basename(path)], os.listdir(self.folder))
            os.remove(path)

    def test_files_are_moved_together(self):
        for kind in FEW:
            driver = gdal.GetDriverByName(kind.driver)
            for folder in (self.folder, self.memory):
                names = [folder + '/' + stem + kind.extension for stem in 'abc']
                kind.write(names[0], kind.samples())
                file = gdal.Open(names[0])
                file.BuildOverviews('NEAREST', [2])
                describe(file)
                file = None
                with self.subTest(kind.name, folder=folder):
                    self.assertEqual(gdal.CE_None, driver.CopyFiles(names[1], names[0]))
                    self.assertEqual(gdal.CE_None, driver.Rename(names[2], names[0]))
                    self.assertIsNone(gdal.VSIStatL(names[0]))
                    for name in names[1:]:
                        found = gdal.Open(name)
                        self.assertEqual([name, name + '.aux.xml', name + '.ovr'],
                                         sorted(found.GetFileList()))
                        self.assertEqual(1, found.GetRasterBand(1).GetOverviewCount())
                        self.assertEqual('1', found.GetMetadataItem('DAY'))
                        self.assertSamples(kind.samples(), images.bands_of(found))
                        found = None
                        self.assertEqual(gdal.CE_None, driver.Delete(name))
                    self.assertEqual([], [name for name in gdal.ReadDir(folder) or []
                                          if name not in ('.', '..')])


if __name__ == '__main__':
    images.main()
