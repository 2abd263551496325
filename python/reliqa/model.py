"""reliqa.Model: a model text, scored exactly as the phone scores it."""

from __future__ import annotations

import json
import math
import os
import tempfile
from typing import Any, Iterable, List, Mapping, Optional, Sequence, Tuple, Union

import numpy as np

from . import _native
from ._ids import feature_ids as _feature_ids

PathLike = Union[str, "os.PathLike[str]"]
_Missing = Optional[float]


class Model:
    """A boosted-tree model in reliqa's model text format.

    Scores are bit-identical to the phone's ``BoostingModel::predict`` on a
    feature map holding each row's present cells: the same float conversion,
    the same trees (and, with a model selector, the same sub-model) and the
    same logistic.

    Parameters
    ----------
    text:
        The model text (the base64 lines that ``reliqa set-model`` stores), as
        ``str`` or ``bytes``.

    Raises
    ------
    ValueError
        When the text is not a model the library can load.
    """

    def __init__(self, text: Union[str, bytes], *, _name: str = "the model text", _walk: str = "") -> None:
        # _walk ("portable", "scalar", "avx512") forces one way of walking the
        # trees, for benchmarks; every walk gives the same bits.
        if isinstance(text, str):
            text = text.encode("utf-8")
        if not isinstance(text, (bytes, bytearray, memoryview)):
            raise TypeError(f"a model text is str or bytes, not {type(text).__name__}")
        self._native = _native.Model(bytes(text), _name, _walk)

    @classmethod
    def load(cls, path: PathLike) -> "Model":
        """Reads a model text from a file."""
        with open(path, "rb") as f:
            return cls(f.read(), _name=os.fspath(path))

    @classmethod
    def from_xgboost(cls, model: Any, *, feature_ids: Optional[Sequence[int]] = None) -> "Model":
        """Converts an XGBoost model, as ``reliqa convert xgboost`` does.

        Parameters
        ----------
        model:
            An ``xgboost.Booster`` (or an ``XGBClassifier``/``XGBRegressor``),
            a path to a model saved as JSON, or the JSON itself as bytes.
        feature_ids:
            The feature id of each XGBoost feature, in order. Without it the
            feature names must be the ids ("1", "2", ...).

        Raises
        ------
        ValueError
            For a model that cannot be represented (not ``gbtree`` with a
            logistic objective, categorical splits, ...), with the reason.
        """
        name = "the XGBoost model"
        if hasattr(model, "get_booster"):
            model = model.get_booster()
        if hasattr(model, "save_raw"):
            data = bytes(model.save_raw(raw_format="json"))
        elif isinstance(model, (bytes, bytearray, memoryview)):
            data = bytes(model)
        elif isinstance(model, (str, os.PathLike)):
            name = os.fspath(model)
            if name.endswith(".ubj"):
                raise ValueError(f"{name}: binary (UBJSON) models cannot be read; save the model as JSON")
            with open(model, "rb") as f:
                data = f.read()
        else:
            raise TypeError(f"from_xgboost() takes a Booster, a path or JSON bytes, not {type(model).__name__}")
        ids = [] if feature_ids is None else _feature_ids(feature_ids, what="feature_ids item")
        converted = cls.__new__(cls)
        converted._native = _native.Model.from_xgboost(data, name, ids)
        return converted

    def save(self, path: PathLike) -> None:
        """Writes the model text to `path` (through a temporary file, so that a
        failure leaves no partial file)."""
        path = os.fspath(path)
        fd, tmp = tempfile.mkstemp(prefix=os.path.basename(path) + ".", dir=os.path.dirname(path) or ".")
        try:
            with os.fdopen(fd, "wb") as f:
                f.write(self._native.text)
                f.flush()
                os.fsync(f.fileno())
            os.chmod(tmp, 0o644)
            os.replace(tmp, path)
        except BaseException:
            if os.path.exists(tmp):
                os.unlink(tmp)
            raise

    @property
    def text(self) -> bytes:
        """The model text."""
        return self._native.text

    @property
    def feature_ids(self) -> np.ndarray:
        """The model's feature ids (its featureMapping), int32, in the order of
        the feature vector: the default column order of :meth:`predict`."""
        return self._native.feature_ids

    @property
    def num_trees(self) -> int:
        """Trees in the model text (trees of weight 0 included)."""
        return self._native.num_trees

    @property
    def base_score(self) -> float:
        """The raw score that the trees' leaves are added to (a margin, not a
        probability)."""
        return self._native.base_score

    def predict(
        self,
        X: Any,
        *,
        feature_ids: Optional[Sequence[Union[int, str]]] = None,
        missing: _Missing = math.nan,
        output_margin: bool = False,
        nthread: int = 0,
    ) -> np.ndarray:
        """Scores the rows of `X`.

        Parameters
        ----------
        X:
            A 2-D float32 or float64 numpy array, in any memory order (it is
            not copied; other number types are copied once as float64), or a
            pandas DataFrame whose column names are feature ids (ints or
            decimal strings), in any order.
        feature_ids:
            The feature id of each column of an array. Default: the model's
            :attr:`feature_ids`. Columns the model does not use are ignored;
            features the model uses that no column gives read 0.0.
        missing:
            A cell equal to this value is an absent feature and reads 0.0, as
            an id absent from the phone's map does (NaN matches NaN; float32
            cells are compared with the float32 nearest to it). With
            ``None`` every cell is a value, and NaN takes the trees' NaN
            branches. (The phone classifies no collection whose features hold
            NaN or an infinity.)
        output_margin:
            Return raw scores instead of probabilities.
        nthread:
            Threads to score with; 0 or -1 means one per core. Every count
            gives the same bits.

        Returns
        -------
        numpy.ndarray
            float64, one score per row.
        """
        missing, nthread = _missing_and_threads(missing, nthread)
        if feature_ids is None and type(X) is np.ndarray and X.dtype in _FLOATS:
            return self._native.predict(X, None, missing, bool(output_margin), nthread)
        X, column_ids = _matrix(X, feature_ids, what="X")
        return self._native.predict(X, column_ids, missing, bool(output_margin), nthread)

    def contributions(
        self,
        X: Any,
        *,
        feature_ids: Optional[Sequence[Union[int, str]]] = None,
        background: Any = None,
        missing: _Missing = math.nan,
        nthread: int = 0,
    ) -> np.ndarray:
        """Exact per-feature contributions (Shapley values) to each row's raw
        score, by path-dependent tree SHAP.

        For every row, the bias plus the contributions is the raw score that
        ``predict(X, output_margin=True)`` gives (up to rounding). The trees
        and branches are exactly those of scoring: with a model selector only
        the selected sub-model is explained (the selector itself gets no
        share).

        Parameters
        ----------
        X, feature_ids, missing:
            As for :meth:`predict`.
        background:
            Rows (an array with the columns of an array `X`, or a
            DataFrame naming its own) whose
            counts through each tree node serve as the node covers: the
            logged feature vectors of real traffic, for instance. Without it
            the model must come from :meth:`from_xgboost`, which keeps the
            trainer's covers; a model read from its text has none.
        nthread:
            As for :meth:`predict`; every count gives the same bits.

        Returns
        -------
        numpy.ndarray
            float64 of shape ``(n, k + 1)``: column ``i < k`` is the
            contribution of feature :attr:`feature_ids` ``[i]``, the last
            column is the bias (the expected raw score).

        Raises
        ------
        ValueError
            Without covers, or for rows that do not fit the model.
        """
        missing, nthread = _missing_and_threads(missing, nthread)
        X, column_ids = _matrix(X, feature_ids, what="X")
        background_ids = None
        if background is not None:
            ids = None if _is_dataframe(background) else feature_ids
            background, background_ids = _matrix(background, ids, what="background")
        return self._native.contributions(X, column_ids, background, background_ids, missing, nthread)

    def predict_rows(
        self,
        rows: Iterable[Union[Mapping[Union[int, str], float], str, bytes]],
        *,
        missing: _Missing = math.nan,
        output_margin: bool = False,
    ) -> np.ndarray:
        """Scores sparse rows.

        Parameters
        ----------
        rows:
            Dicts from feature id (int or decimal string) to value, or JSON
            texts of that shape, such as the "feature_vector" that phones log.
        missing, output_margin:
            As for :meth:`predict`.
        """
        if missing is not None:
            missing = float(missing)
        return self._native.predict_rows(rows, missing, bool(output_margin))

    def __reduce__(self):
        # Pickled as its text (and the trainer's covers, when it has them): a
        # model crosses to other processes (joblib, multiprocessing) and
        # loads there as here.
        covers = self._native.covers
        if covers is None:
            return (Model, (self.text,))
        return (_with_covers, (self.text, covers))

    def __repr__(self) -> str:
        return f"<reliqa.Model: {self.num_trees} trees over {len(self.feature_ids)} features>"


def _with_covers(text: bytes, covers: np.ndarray) -> Model:
    model = Model(text)
    model._native.set_covers(covers)
    return model


def _missing_and_threads(missing: _Missing, nthread: int) -> Tuple[Optional[float], int]:
    if missing is not None:
        missing = float(missing)
    nthread = int(nthread)
    if nthread == -1:
        nthread = 0
    if not 0 <= nthread <= 4096:
        raise ValueError(f"nthread must be -1 or 0 (every core) up to 4096, got {nthread}")
    return missing, nthread


def _matrix(X: Any, feature_ids: Optional[Sequence[Union[int, str]]], *, what: str) -> Tuple[np.ndarray, Optional[List[int]]]:
    """`X` as a float array the native side reads without a copy, and the
    feature id of each of its columns (None: the model's own order)."""
    column_ids = None
    if _is_dataframe(X):
        column_ids = _feature_ids(X.columns, what="column")
        if feature_ids is not None:
            raise ValueError("feature_ids is for arrays; a DataFrame names its columns itself")
        X = _frame_values(X)
    elif feature_ids is not None:
        column_ids = _feature_ids(feature_ids, what="feature_ids item")
    if not isinstance(X, np.ndarray):
        raise TypeError(f"{what} must be a numpy array or a pandas DataFrame, not {type(X).__name__}")
    if X.dtype not in _FLOATS:
        if not (np.issubdtype(X.dtype, np.number) or X.dtype == np.bool_) or np.iscomplexobj(X):
            raise ValueError(f"{what} must hold real numbers, got {X.dtype}")
        X = X.astype(np.float64)  # other number types: one copy, as doubles
    return X, column_ids


def _is_dataframe(x: Any) -> bool:
    return type(x).__name__ == "DataFrame" and hasattr(x, "columns") and hasattr(x, "dtypes")


def _frame_values(frame: Any) -> np.ndarray:
    """The cells of a DataFrame as one float array, without a copy where the
    frame holds one block of float32 or float64. Nullable columns give NaN
    for their missing cells."""
    import pandas as pd

    dtypes = set(frame.dtypes)
    if len(dtypes) == 1 and next(iter(dtypes)) in _FLOATS:
        return frame.to_numpy(copy=False)
    for name, dtype in frame.dtypes.items():
        numeric = pd.api.types.is_numeric_dtype(dtype) or pd.api.types.is_bool_dtype(dtype)
        if not numeric or isinstance(dtype, pd.CategoricalDtype) or pd.api.types.is_complex_dtype(dtype):
            raise ValueError(f"column {name!r} holds {dtype}, not real numbers")
    return frame.to_numpy(dtype=np.float64, na_value=np.nan)


_FLOATS = (np.dtype(np.float32), np.dtype(np.float64))
