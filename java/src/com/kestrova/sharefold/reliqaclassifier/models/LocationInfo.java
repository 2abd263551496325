package com.kestrova.sharefold.reliqaclassifier.models;

/** Where a collection was taken. */
public record LocationInfo(String name, boolean isLandmark, double longitude, double latitude) {}
