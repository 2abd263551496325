package com.kestrova.sharefold.reliqaclassifier.models;

/** Counts of a collection's assets by kind. */
public record AssetCounts(
    int tileCount,
    int totalAssetsCount,
    int photosCount,
    int burstCount,
    int loopsCount,
    int videosCount,
    int totalAssetsWithinBurstsCount,
    int totalAssetsWithinLoopsCount,
    int facesCount,
    int photosWithFacesCount) {}
