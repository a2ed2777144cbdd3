#!/bin/sh
# python.sh PYTHON SCRIPT [ARGUMENT...]: runs a script with the libraries of GDAL_TEST_PRELOAD loaded
# first. Only Python gets them, and not the shell.
LD_PRELOAD=${GDAL_TEST_PRELOAD:-} exec "$@"
