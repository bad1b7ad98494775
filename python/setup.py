# SPDX-License-Identifier: Apache-2.0
"""The wheel carries the library and the service, which are of one machine, and no extension module,
which would be of one Python. scripts/wheel puts both in place before it calls this."""
import os

from setuptools import setup
from setuptools.dist import Distribution
from wheel.bdist_wheel import bdist_wheel


class BinaryDistribution(Distribution):
    def has_ext_modules(self):
        return True


class AnyPython(bdist_wheel):
    def get_tag(self):
        return ("py3", "none", super().get_tag()[2])


setup(version=os.environ["KEELGATE_VERSION"], distclass=BinaryDistribution,
      cmdclass={"bdist_wheel": AnyPython})
