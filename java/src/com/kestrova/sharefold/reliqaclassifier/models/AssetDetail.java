package com.kestrova.sharefold.reliqaclassifier.models;

/**
 * One photo or video of a collection. Dates are seconds since the Unix epoch (-1 for an unknown
 * modification date); {@code isFavorite} and {@code isHidden} are 0 or 1.
 */
public record AssetDetail(
    String assetID,
    String assetType,
    long creationDateSinceEpoch,
    long modificationDateSinceEpoch,
    double pixelWidth,
    double pixelHeight,
    double latitude,
    double longitude,
    double videoDuration,
    int isFavorite,
    int isHidden,
    int mediaSubtypes,
    int sourceType,
    OptionalImageMetricValue blurrinessMetric,
    OptionalImageMetricValue darknessMetric) {}
