package com.kestrova.sharefold.reliqaclassifier.models;

/**
 * One candidate collection to classify.
 *
 * <p>{@code locationInfo} and {@code assetCounts} may be null (no location; all counts zero).
 * Every other reference, including each array element and every string inside, must be non-null;
 * {@link ReliqaClassifier#classify} rejects a null with a {@link NullPointerException} naming it.
 * Arrays are read as they are at the time of the call.
 */
public record ReliqaClassifierInput(
    String collectionID,
    double timeSinceStory,
    LocationInfo locationInfo,
    AssetCounts assetCounts,
    AssetDetail[] assetDetails,
    DuplicateInfo[] duplicateInfos) {}
