"""reliqa.Classifier: the phone's classifier over the tool's SQLite store."""

from __future__ import annotations

import json
import math
import os
import warnings
from typing import Any, Dict, Mapping, Union

from . import _native
from ._ids import feature_id


class Classifier:
    """Classifies collections with the model parameters kept in a store.

    Parameters
    ----------
    store:
        Path of the SQLite store (created when absent), the one the ``reliqa``
        tool uses with ``--store``. Its entries are the classifier's own, so
        the tool and this class see each other's parameters.

    A call refused for its input (a model text that does not load, a
    threshold or feature value the store cannot hold) raises ValueError
    before anything is written. Failures of the store itself are logged and
    absorbed, as on the phone. One classifier may be shared by threads.
    """

    def __init__(self, store: Union[str, "os.PathLike[str]"]) -> None:
        self._native = _native.Classifier(os.fspath(store))

    def set_model(self, text: Union[str, bytes], model_id: str, threshold: float) -> None:
        """Stores new model parameters.

        An empty `text` keeps the stored model and changes only the identifier
        and the threshold. A text the library cannot load is refused before
        anything is stored; a doubtful one (another format version, no trees)
        is stored with a warning.
        """
        if isinstance(text, str):
            text = text.encode("utf-8")
        if not isinstance(model_id, str):
            raise ValueError(f"model_id is a str, not {type(model_id).__name__}")
        threshold = float(threshold)
        for message in self._native.set_model(bytes(text), model_id, threshold):
            warnings.warn(message, stacklevel=2)

    def set_server_features(self, features: Mapping[Union[int, str], Union[int, float, str]]) -> None:
        """Replaces the stored server features, which override the computed
        features of the same ids in every later classification.

        Keys are feature ids as ints or strings, values numbers or strings;
        strings are read as the app's map of texts is read (ids by C ``atoi``
        rules, values by C ``strtod``). Values the store could not give back
        as the same number (NaN, infinities) are refused with ValueError.
        """
        members = []
        for key, value in features.items():
            if isinstance(key, str):
                key_text = key
            else:
                key_text = str(feature_id(key, where="server features"))
            if isinstance(value, str):
                value_text = json.dumps(value)
            elif isinstance(value, bool) or not isinstance(value, (int, float)) and not hasattr(value, "__float__"):
                raise ValueError(f"server feature {key!r}: a value is a number or a string, not {type(value).__name__}")
            elif isinstance(value, int):
                value_text = str(value)
            else:
                number = float(value)
                # Non-finite numbers go as text, for the reader's own message.
                value_text = repr(number) if math.isfinite(number) else json.dumps(repr(number))
            members.append(f"{json.dumps(key_text)}:{value_text}")
        self._native.set_server_features("{" + ",".join(members) + "}")

    def classify(self, collection: Union[Mapping[str, Any], str, bytes]) -> Dict[str, Any]:
        """Classifies one collection (a dict or JSON text in the tool's
        collection form).

        Returns the tool's result object as a dict: ``score``,
        ``isOverThreshold`` and ``loggingData`` (its four keys).
        """
        if isinstance(collection, Mapping):
            try:
                collection = json.dumps(collection, allow_nan=False)
            except (TypeError, ValueError) as e:
                raise ValueError(f"the collection cannot be written as JSON: {e}") from None
        elif isinstance(collection, bytes):
            collection = collection.decode("utf-8", errors="replace")
        elif not isinstance(collection, str):
            raise ValueError(f"a collection is a dict or a JSON text, not {type(collection).__name__}")
        return self._native.classify(collection)

    @property
    def model_id(self) -> str:
        """The identifier of the model in use ("" before any)."""
        return self._native.model_id
