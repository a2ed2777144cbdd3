#!/usr/bin/python3
"""Draws the picture of images in QGIS that the documents show: its layer panel and its map.

    scripts/demo
    GDAL_DRIVER_PATH=build/gdal/gdal docs/pictures/qgis_scene.py docs/pictures/qgis.png \\
        demo/scene_rgb_tiled.img demo/scene_rgb.d demo/scene_gray12_tiled.img

No screen is needed. Debian packages: python3-qgis, qgis-providers, python3-pil, fonts-dejavu-core.
"""

import argparse
import os
import sys

os.environ.setdefault("QT_QPA_PLATFORM", "offscreen")
os.environ.setdefault("GDAL_PAM_ENABLED", "NO")  # statistics are not written beside the images

from osgeo import gdal
from PIL import Image
from qgis.core import (QgsApplication, QgsContrastEnhancement, QgsLayerTreeModel, QgsProject,
                       QgsRasterLayer, QgsRasterMinMaxOrigin)
from qgis.gui import QgsLayerTreeView, QgsMapCanvas
from qgis.PyQt.QtCore import QSize
from qgis.PyQt.QtGui import QFont
from qgis.PyQt.QtWidgets import QLabel, QMainWindow, QSplitter

SIZE = QSize(760, 470)
PANEL = 200  # width of the layer panel
COLOURS = 255  # of the PNG file, which is to be small


def stretch(layer):
    """Stretches the layer as QGIS does by default: from 2 % to 98 % of its samples."""
    limits = QgsRasterMinMaxOrigin()
    limits.setLimits(QgsRasterMinMaxOrigin.CumulativeCut)
    limits.setStatAccuracy(QgsRasterMinMaxOrigin.Exact)
    layer.renderer().setMinMaxOrigin(limits)
    layer.setContrastEnhancement(QgsContrastEnhancement.StretchToMinimumMaximum,
                                 QgsRasterMinMaxOrigin.CumulativeCut)


def describe(path):
    """Says in a line what GDAL found in the file."""
    image = gdal.Open(path)
    band = image.GetRasterBand(1)
    blocks = " x ".join(map(str, band.GetBlockSize()))
    return (f"  GDAL driver {image.GetDriver().ShortName}:  {image.RasterXSize} x "
            f"{image.RasterYSize} samples, {image.RasterCount} band"
            f"{'s' if image.RasterCount > 1 else ''} of {gdal.GetDataTypeName(band.DataType)}, "
            f"blocks of {blocks}")


def open_layer(path):
    layer = QgsRasterLayer(path, os.path.basename(path))
    if not layer.isValid():
        sys.exit(f"{path}: QGIS cannot open it: {layer.error().summary()}")
    stretch(layer)
    return layer


def show(layers):
    """Makes a window of the layer panel, the map, and a line about the first layer, the top one."""
    project = QgsProject.instance()
    for layer in reversed(layers):  # the project puts each on top
        project.addMapLayer(layer)
    panel = QgsLayerTreeView()
    model = QgsLayerTreeModel(project.layerTreeRoot(), panel)
    model.setFlag(QgsLayerTreeModel.AllowNodeChangeVisibility)  # shows boxes to tick
    panel.setModel(model)
    panel.expandAll()
    canvas = QgsMapCanvas()
    canvas.setLayers(layers)
    parts = QSplitter()
    parts.addWidget(panel)
    parts.addWidget(canvas)
    window = QMainWindow()
    window.setCentralWidget(parts)
    window.statusBar().setSizeGripEnabled(False)
    window.statusBar().addWidget(QLabel(describe(layers[0].source())))
    window.resize(SIZE)
    window.show()
    parts.setSizes([PANEL, SIZE.width() - PANEL])
    QgsApplication.processEvents()
    canvas.setExtent(layers[0].extent())
    canvas.refresh()
    canvas.waitWhileRendering()
    return window


def main():
    parser = argparse.ArgumentParser(description="Draws a picture of images in QGIS.")
    parser.add_argument("picture", help="the PNG file to write")
    parser.add_argument("images", nargs="+", metavar="image",
                        help="a VITec or Helava file; the first is on top")
    options = parser.parse_args()

    application = QgsApplication([], True)
    application.initQgis()
    application.setFont(QFont("DejaVu Sans", 8))
    window = show([open_layer(path) for path in options.images])
    if not window.grab().toImage().save(options.picture, "PNG"):
        sys.exit(f"{options.picture}: cannot be written")
    drawn = Image.open(options.picture).convert("RGB")
    drawn.quantize(COLOURS).save(options.picture, optimize=True)
    window.close()
    QgsProject.instance().clear()
    application.exitQgis()


if __name__ == "__main__":
    main()
