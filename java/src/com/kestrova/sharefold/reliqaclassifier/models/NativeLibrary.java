package com.kestrova.sharefold.reliqaclassifier.models;

/**
 * Loads the host library and the classifier library, whose loading registers the natives of the
 * two wrapper classes. Every class with natives calls {@link #load()} from its static initializer,
 * so the natives are bound whichever class is used first.
 */
final class NativeLibrary {
  static {
    System.loadLibrary("kestrova_host");
    System.loadLibrary("reliqaclassifier");
  }

  private NativeLibrary() {}

  static void load() {
    // Loading happens once, in the static initializer.
  }
}
