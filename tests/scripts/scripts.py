"""The scripts as modules, to look at what they decide."""

import importlib.machinery
import importlib.util
import pathlib
import sys

FOLDER = pathlib.Path(__file__).resolve().parent.parent.parent / "scripts"


def load(name):
    sys.dont_write_bytecode = True
    loader = importlib.machinery.SourceFileLoader(name, str(FOLDER / name))
    module = importlib.util.module_from_spec(importlib.util.spec_from_loader(name, loader))
    sys.modules[name] = module
    loader.exec_module(module)
    return module
