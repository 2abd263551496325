package com.kestrova.jni;

/**
 * A failure of native code that has no closer Java equivalent. The message is the native error's
 * own description.
 */
public class CppException extends RuntimeException {
  private static final long serialVersionUID = 1L;

  public CppException(String message) {
    super(message);
  }
}
