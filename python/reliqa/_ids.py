"""Feature ids as the library reads them: signed 32-bit integers."""

from __future__ import annotations

from typing import Any, Iterable, List

import numpy as np

_INT32 = np.iinfo(np.int32)


def feature_id(value: Any, *, where: str) -> int:
    """One feature id from an int (numpy ints too) or a decimal string."""
    if isinstance(value, (bool, np.bool_)):
        raise ValueError(f"{where}: a feature id is an int or a decimal string, not {value!r}")
    if isinstance(value, (int, np.integer)):
        number = int(value)
    elif isinstance(value, str):
        # As the native reader of rows takes them: an optional minus, digits.
        body = value[1:] if value.startswith("-") else value
        if not body.isdigit() or not body.isascii():
            raise ValueError(f"{where}: feature id {value!r} is not a decimal integer")
        number = int(value)
    else:
        raise ValueError(f"{where}: a feature id is an int or a decimal string, not {type(value).__name__}")
    if not _INT32.min <= number <= _INT32.max:
        raise ValueError(f"{where}: feature id {value!r} is outside the signed 32-bit range")
    return number


def feature_ids(values: Iterable[Any], *, what: str) -> List[int]:
    """Feature ids of columns; `what` names them in messages ("column 3")."""
    out = [feature_id(v, where=f"{what} {i}") for i, v in enumerate(values)]
    seen = {}
    for i, v in enumerate(out):
        if v in seen:
            raise ValueError(f"{what}s {seen[v]} and {i} both name feature id {v}")
        seen[v] = i
    return out
