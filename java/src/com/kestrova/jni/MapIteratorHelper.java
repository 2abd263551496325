package com.kestrova.jni;

import java.util.Iterator;
import java.util.Map;

/**
 * Lets native code walk a {@link Map} with one method call per entry: each {@link #hasNext()} that
 * returns true moves to the next entry and exposes it in {@code mKey} and {@code mValue}. Entries
 * come in the map's own iteration order.
 */
public final class MapIteratorHelper {
  private final Iterator<? extends Map.Entry<?, ?>> mIterator;
  private Object mKey;
  private Object mValue;

  public MapIteratorHelper(Map<?, ?> map) {
    mIterator = map.entrySet().iterator();
  }

  /** Advances to the next entry; false (and no current entry) when there is none. */
  boolean hasNext() {
    if (!mIterator.hasNext()) {
      mKey = null;
      mValue = null;
      return false;
    }
    Map.Entry<?, ?> entry = mIterator.next();
    mKey = entry.getKey();
    mValue = entry.getValue();
    return true;
  }
}
