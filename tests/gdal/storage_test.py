"""Where files lie and whose they are: other drivers' files, names, archives, and a server that is
asked for ranges."""
import gzip
import http.server
import io
import os
import re
import struct
import threading
import unittest
import zipfile

from osgeo import gdal

import images
from images import Errors, FEW, KINDS, Kind

for name in list(os.environ):
    if name.lower().endswith('_proxy'):
        del os.environ[name]
HELAVA_MAGIC = struct.pack('>I', 0x48411484)


def other_drivers():
    return [gdal.GetDriver(i).ShortName for i in range(gdal.GetDriverCount())
            if gdal.GetDriver(i).ShortName not in ('VITec', 'Helava')]


class Identity(images.ImageTest):
    def test_files_of_other_drivers(self):
        """Of the same names, and with the bytes of a Helava trailer's end behind them."""
        for driver, name in (('HFA', 'x.img'), ('ENVI', 'x.img'), ('ENVI', 'x.d'), ('GTiff', 'x.d'),
                             ('GTiff', 'x.tif'), ('PCIDSK', 'x.pix'), ('ISIS2', 'x.img')):
            for end in (b'', HELAVA_MAGIC):
                if end and name.endswith('.d'):
                    continue
                path = self.memory + '/' + name
                gdal.GetDriverByName(driver).CreateCopy(path, images.memory_copy(
                    Kind('VITec', 1).samples()))
                images.write_file(path, images.read_file(path) + end)
                with self.subTest(driver, name=name, end=end), Errors() as errors:
                    found = gdal.Open(path)
                    self.assertEqual([], errors.failures())
                    self.assertEqual(driver, found.GetDriver().ShortName)
                    found = None
                    gdal.GetDriverByName(driver).Delete(path)

    def test_no_other_driver_opens_ours(self):
        others = other_drivers()
        for kind in KINDS:
            path = kind.write(self.memory + '/x' + kind.extension, kind.samples())
            with self.subTest(kind.name):
                self.assertEqual(kind.driver, gdal.IdentifyDriver(path).ShortName)
                self.assertIsNone(gdal.OpenEx(path, gdal.OF_RASTER, allowed_drivers=others))

    def test_what_is_neither(self):
        """A magic word alone makes no image, and identifying is silent."""
        vitec, helava = (kind.content(kind.samples()) for kind in (FEW[0], FEW[2]))
        far = bytearray(vitec[:136] + bytes(4) + vitec[140:]) + bytes(4000)  # no version there
        struct.pack_into('>I', far, 4, 3000)
        for content in (bytes(far), b'', vitec[:4], vitec[:47], vitec[:136] + bytes(4) + vitec[140:],
                        bytes(2000), HELAVA_MAGIC, bytes(100) + HELAVA_MAGIC, helava[:-1],
                        b'x' + helava):
            for name in ('x.img', 'x.tif', 'x'):
                images.write_file(self.memory + '/' + name, content)
                with self.subTest(len(content), name=name), Errors() as errors:
                    self.assertIsNone(gdal.IdentifyDriver(self.memory + '/' + name))
                    self.assertEqual([], errors)


class Names(images.ImageTest):
    def test_any_name(self):
        for kind in FEW:
            for folder in (self.folder, self.memory):
                for name in ('a@b' + kind.extension, '@', 'x@memory', 'no extension', 'wrong.tif',
                             'd@e/x' + kind.extension, '\u00e4\u6f22' + kind.extension):
                    path = folder + '/' + name
                    gdal.MkdirRecursive(os.path.dirname(path), 0o755)
                    with self.subTest(path):
                        copy = gdal.GetDriverByName(kind.driver).CreateCopy(
                            path, images.memory_copy(kind.samples()), 1, kind.options())
                        copy = None
                        self.assertSamples(kind.samples(),
                                           images.bands_of(gdal.Open(path, gdal.GA_Update)))
                        self.assertEqual([path], gdal.Open(path).GetFileList())
                        self.assertEqual(gdal.CE_None,
                                         gdal.GetDriverByName(kind.driver).Delete(path))
                        self.assertIsNone(gdal.VSIStatL(path))


class VirtualFiles(images.ImageTest):
    def test_archives(self):
        for kind in KINDS:
            content, name = kind.content(kind.samples()), kind.name + kind.extension
            packed = io.BytesIO()
            with zipfile.ZipFile(packed, 'w', zipfile.ZIP_DEFLATED) as archive:
                archive.writestr('in/' + name, content)
            images.write_file(self.memory + '/' + name + '.zip', packed.getvalue())
            images.write_file(self.memory + '/' + name + '.gz', gzip.compress(content))
            images.write_file(self.memory + '/' + name, b'noise' + content + b'noise')
            for path in ('/vsizip/' + self.memory + '/' + name + '.zip/in/' + name,
                         '/vsigzip/' + self.memory + '/' + name + '.gz',
                         '/vsisubfile/5_%d,%s' % (len(content), self.memory + '/' + name)):
                with self.subTest(path), Errors() as errors:
                    found = gdal.Open(path)
                    self.assertSamples(kind.samples(), images.bands_of(found))
                    self.assertSamples(kind.samples()[-1, 30:37, 20:53],
                                       found.GetRasterBand(kind.nbands).ReadAsArray(20, 30, 33, 7))
                    self.assertEqual([], errors)

    def test_archives_take_no_new_files(self):
        for driver in ('VITec', 'Helava'):
            path = '/vsizip/' + self.memory + '/new.zip/x'
            with self.refused(driver, path):
                self.assertIsNone(gdal.GetDriverByName(driver).Create(path, 5, 5))
            self.assertIsNone(gdal.VSIStatL(self.memory + '/new.zip'))


class Server:
    """Serves files by name, whole or in ranges; counts the requests and the bytes it sends."""

    def __init__(self, files):
        self.requests, self.sent = [], 0
        outer = self

        class Handler(http.server.BaseHTTPRequestHandler):
            protocol_version = 'HTTP/1.1'

            def log_message(self, *_):
                pass

            def do_HEAD(self):
                self.do_GET()

            def do_GET(self):
                content = files.get(self.path[1:])
                asked = re.fullmatch(r'bytes=(\d+)-(\d*)', self.headers.get('Range', ''))
                outer.requests.append((self.command, self.path, self.headers.get('Range')))
                if content is None:
                    self.send_response(404)
                    content = b''
                elif asked:
                    first, last = int(asked[1]), int(asked[2] or len(content) - 1)
                    self.send_response(206)
                    self.send_header('Content-Range', 'bytes %d-%d/%d' % (
                        first, min(last, len(content) - 1), len(content)))
                    content = content[first:last + 1]
                else:
                    self.send_response(200)
                self.send_header('Accept-Ranges', 'bytes')
                self.send_header('Content-Length', str(len(content)))
                self.end_headers()
                if self.command == 'GET':
                    try:
                        self.wfile.write(content)
                    except OSError:
                        pass  # the client has seen enough
                    outer.sent += len(content)

        self.server = http.server.ThreadingHTTPServer(('127.0.0.1', 0), Handler)
        self.server.daemon_threads = True
        self.thread = threading.Thread(target=self.server.serve_forever)
        self.thread.start()

    def url(self, name):
        return '/vsicurl/http://127.0.0.1:%d/%s' % (self.server.server_address[1], name)

    def stop(self):
        self.server.shutdown()
        self.server.server_close()
        self.thread.join()


class Remote(images.ImageTest):
    def test_ranges(self):
        """A 300 x 200 window of 9 MB: at most 1 MB and eight requests, those of the open included."""
        kinds = [Kind('VITec', 3, 'u1', (256, 256), shape=(1700, 1760)),
                 Kind('VITec', 1, 'u2', (128, 128), shape=(2100, 2100)),
                 Kind('Helava', 3, shape=(1700, 1760))]
        for number, kind in enumerate(kinds):
            samples, name = kind.samples(), 'scene%d%s' % (number, kind.extension)
            server = Server({name: kind.content(samples)})
            self.addCleanup(server.stop)
            with self.subTest(kind.name), Errors() as errors:
                found = gdal.Open(server.url(name))
                window = found.GetRasterBand(1).ReadAsArray(700, 900, 300, 200)
                self.assertSamples(samples[0, 900:1100, 700:1000], window)
                self.assertEqual([], errors)
                self.assertLessEqual(server.sent, 1 << 20, server.requests)
                self.assertLessEqual(len(server.requests), 8, server.requests)
                self.assertSamples(samples[-1, -9:, -7:], found.GetRasterBand(kind.nbands)
                                   .ReadAsArray(1753 if kind.shape[1] == 1760 else 2093,
                                                kind.shape[0] - 9, 7, 9))

    def test_truncated_on_the_server(self):
        kind = Kind('VITec', 1, 'u1', (64, 64), shape=(300, 300))
        server = Server({'x.img': kind.content(kind.samples())[:50000]})
        self.addCleanup(server.stop)
        found = gdal.Open(server.url('x.img'))
        self.assertSamples(kind.samples()[0, :64], found.ReadAsArray(0, 0, 300, 64))
        with self.refused('VITec', server.url('x.img'), 'line'):
            self.assertIsNone(found.ReadAsArray(0, 250, 300, 20))


if __name__ == '__main__':
    images.main()
