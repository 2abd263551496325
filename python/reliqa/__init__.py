"""reliqa for Python: the phone's exact features and scores in numpy.

The native library that phones run, with its own float conversion, trees and
logistic, so that a score computed here is bit for bit the phone's:

- :class:`Model` reads a model text (or converts an XGBoost model) and scores
  dense matrices, DataFrames and sparse rows;
- :func:`features` computes the 74 features of collections into a DataFrame;
- :class:`Classifier` classifies collections over the SQLite store that the
  ``reliqa`` tool uses;
- :func:`replay` scores logged classifications with a candidate model, on a
  Dask cluster or in process, and reports what it would change
  (``python3 -m reliqa replay`` from a shell).

Example::

    import reliqa
    model = reliqa.Model.load("examples/model.txt")
    X = reliqa.features("examples/collection.json")
    model.predict(X)          # the phone's score, without server features
"""

from .model import Model
from .features import features
from .classifier import Classifier
from ._replay import ReplayError, ReplayReport, replay

__all__ = ["Model", "features", "Classifier", "replay", "ReplayReport", "ReplayError"]
__version__ = "0.1.0"
