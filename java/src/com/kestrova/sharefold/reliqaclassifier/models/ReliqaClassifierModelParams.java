package com.kestrova.sharefold.reliqaclassifier.models;

/**
 * A model-parameter update: the serialized model text, its identifier and the decision threshold.
 * An empty {@code mSerializedModel} keeps the loaded model and updates only identifier and
 * threshold. No component may be null.
 */
public record ReliqaClassifierModelParams(
    String mSerializedModel, String mModelId, double mThreshold) {}
