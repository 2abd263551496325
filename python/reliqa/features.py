"""reliqa.features: the 74 computed features of collections."""

from __future__ import annotations

import json
import os
from typing import Any, Iterable, List, Mapping, Union

import numpy as np

from . import _native

Collections = Union[str, "os.PathLike[str]", Mapping[str, Any], Iterable[Union[Mapping[str, Any], str, bytes]]]


def features(collections: Collections):
    """Computes the features of collections as the phone does.

    Parameters
    ----------
    collections:
        Collections in the ``reliqa`` tool's collection form (the managed
        input's field names: ``collectionID``, ``assetDetails``, ...), given
        as one dict or JSON text, as an iterable of dicts or JSON texts, or as
        the path of a file holding one collection or JSON Lines (one
        collection per line).

    Returns
    -------
    pandas.DataFrame
        One row per collection, float64 columns 1 to 74 (the feature ids).
        Feature 2 is NaN where a collection has no location. So
        ``model.predict(reliqa.features(c))`` is the phone's score of ``c``
        without server features.

    Notes
    -----
    Hours and days come from the dates in the process's local time zone, as
    on the phone. To compute them for another zone, set it before the call::

        os.environ["TZ"] = "Europe/Lisbon"; time.tzset()

    Raises
    ------
    ValueError
        For a collection the library refuses, naming it (file and line, or
        its index) and the member that is wrong.
    """
    texts, name, lines = _collection_texts(collections)
    values = _native.extract_features(texts, name, lines)
    import pandas as pd

    return pd.DataFrame(values, columns=pd.Index(np.arange(1, _native.FEATURE_COUNT + 1), name="feature"))


def _collection_texts(collections: Collections):
    if isinstance(collections, str) and collections.lstrip().startswith("["):
        raise ValueError("a JSON array is not a collection; give a list of collections instead")
    if isinstance(collections, os.PathLike) or (
        isinstance(collections, str) and not collections.lstrip().startswith("{")
    ):
        return _file_texts(os.fspath(collections))
    if isinstance(collections, (Mapping, str, bytes)):
        collections = [collections]
    texts: List[str] = []
    for i, c in enumerate(collections):
        if isinstance(c, Mapping):
            try:
                texts.append(json.dumps(c, allow_nan=False))
            except (TypeError, ValueError) as e:
                raise ValueError(f"collection {i}: cannot be written as JSON: {e}") from None
        elif isinstance(c, bytes):
            texts.append(c.decode("utf-8", errors="replace"))
        elif isinstance(c, str):
            texts.append(c)
        else:
            raise ValueError(f"collection {i}: a collection is a dict or a JSON text, not {type(c).__name__}")
    return texts, "collection", []


def _file_texts(path: str):
    with open(path, "rb") as f:
        data = f.read().decode("utf-8", errors="replace")
    stripped = data.strip()
    # One collection spread over lines, or JSON Lines.
    if stripped.startswith("{") and "\n" in stripped and not _is_json_lines(stripped):
        return [data], path, [1]
    texts, lines = [], []
    for number, line in enumerate(data.split("\n"), start=1):
        if line.strip():
            texts.append(line)
            lines.append(number)
    return texts, path, lines


def _is_json_lines(text: str) -> bool:
    first = text.split("\n", 1)[0].strip()
    try:
        json.loads(first)
        return True
    except ValueError:
        return False
