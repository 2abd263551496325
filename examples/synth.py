"""Synthetic candidate collections for the examples and the example model.

A collection is a dict with the field names of the collection files that
`reliqa classify` and `reliqa features` read. Everything is drawn from one
numpy RandomState, so a seed always gives the same collections.

The hidden "worth showing" rule used for labels prefers larger collections
with favourites, sharp and bright pictures, a known (ideally famous) place,
few near-duplicates, a mix of videos, and some time since the last story.
"""

import math

import numpy as np

PLACES = [
    ("Lisbon, Alfama", True, -9.1300, 38.7114),
    ("Porto, Ribeira", True, -8.6130, 41.1406),
    ("Sintra", True, -9.3904, 38.8029),
    ("Ericeira", False, -9.4170, 38.9630),
    ("Evora", False, -7.9076, 38.5714),
    ("Coimbra", False, -8.4292, 40.2033),
]

PHOTO_SIZES = [(4032, 3024), (3024, 4032), (4000, 3000), (1170, 2532), (2048, 1536)]
VIDEO_SIZES = [(1920, 1080), (1080, 1920), (3840, 2160)]

# Media subtype bits as the gallery reports them.
SUBTYPE_PANORAMA = 1
SUBTYPE_HDR = 2
SUBTYPE_SCREENSHOT = 4
SUBTYPE_LIVE = 8

SOURCE_LIBRARY = 1
SOURCE_CLOUD_SHARED = 2


def make_collection(rng, index, n_assets=None, start=None):
    """One collection; returns (collection, quality) where quality is the
    hidden score behind the label."""
    if n_assets is None:
        n_assets = int(rng.choice([rng.randint(1, 8), rng.randint(8, 30), rng.randint(30, 90)]))
    if start is None:
        start = 1_690_000_000 + int(rng.randint(0, 30_000_000))
    span_days = float(rng.choice([0.3, 1.0, 3.0, 7.0]))
    has_place = rng.rand() < 0.7
    place = PLACES[rng.randint(len(PLACES))] if has_place else None
    lon0, lat0 = (place[2], place[3]) if place else (float(rng.uniform(-10, 30)), float(rng.uniform(35, 60)))

    # Quality traits of the whole collection.
    sharpness = rng.beta(5, 2)        # high: mostly sharp pictures
    brightness = rng.beta(4, 2)       # high: mostly bright pictures
    fav_rate = rng.beta(1, 6)
    video_rate = rng.beta(1.2, 6)
    screenshot_rate = rng.beta(1, 12)
    dup_rate = rng.beta(1.5, 6)

    assets = []
    n_videos = 0
    n_live = 0
    n_faces = 0
    n_photos_with_faces = 0
    for a in range(n_assets):
        is_video = rng.rand() < video_rate
        created = start + int(rng.uniform(0, span_days * 86400))
        subtypes = 0
        if is_video:
            w, h = VIDEO_SIZES[rng.randint(len(VIDEO_SIZES))]
            duration = float(np.round(rng.gamma(2.0, 9.0), 3))
            n_videos += 1
        else:
            w, h = PHOTO_SIZES[rng.randint(len(PHOTO_SIZES))]
            duration = 0.0
            if rng.rand() < screenshot_rate:
                subtypes |= SUBTYPE_SCREENSHOT
                w, h = 1170, 2532
            else:
                if rng.rand() < 0.25:
                    subtypes |= SUBTYPE_HDR
                if rng.rand() < 0.3:
                    subtypes |= SUBTYPE_LIVE
                    n_live += 1
                if rng.rand() < 0.04:
                    subtypes |= SUBTYPE_PANORAMA
                    w, h = 12000, 3000
            faces = int(rng.poisson(0.8))
            n_faces += faces
            n_photos_with_faces += faces > 0
        modified = -1
        if rng.rand() < 0.35:
            modified = created + int(rng.exponential(3 * 86400))
        blur_calc = rng.rand() < 0.85
        dark_calc = rng.rand() < 0.85
        assets.append({
            "assetID": f"C{index:05d}-A{a:03d}",
            "assetType": "video" if is_video else "photo",
            "creationDateSinceEpoch": created,
            "modificationDateSinceEpoch": modified,
            "pixelWidth": float(w),
            "pixelHeight": float(h),
            "latitude": round(lat0 + float(rng.normal(0, 0.01)), 6),
            "longitude": round(lon0 + float(rng.normal(0, 0.01)), 6),
            "videoDuration": duration,
            "isFavorite": int(rng.rand() < fav_rate),
            "isHidden": int(rng.rand() < 0.02),
            "mediaSubtypes": subtypes,
            "sourceType": SOURCE_CLOUD_SHARED if rng.rand() < 0.1 else SOURCE_LIBRARY,
            "blurrinessMetric": {"isCalculated": bool(blur_calc),
                                 "value": round(float(rng.beta(2, 8 * sharpness + 0.5)), 4) if blur_calc else 0.0},
            "darknessMetric": {"isCalculated": bool(dark_calc),
                               "value": round(float(rng.beta(2, 8 * brightness + 0.5)), 4) if dark_calc else 0.0},
        })
    assets.sort(key=lambda x: x["creationDateSinceEpoch"])

    dupes = []
    for a in range(1, n_assets):
        if rng.rand() < dup_rate:
            dupes.append({"assetIdA": assets[a - 1]["assetID"], "assetIdB": assets[a]["assetID"],
                          "dupeCoefficient": round(float(rng.uniform(0.82, 0.995)), 4)})

    n_photos = n_assets - n_videos
    n_bursts = int(rng.poisson(0.3))
    counts = {
        "tileCount": min(n_assets, 12),
        "totalAssetsCount": n_assets,
        "photosCount": n_photos,
        "burstCount": n_bursts,
        "videosCount": n_videos,
        "loopsCount": n_live // 4,
        "totalAssetsWithinBurstsCount": n_bursts * 5,
        "totalAssetsWithinLoopsCount": n_live,
        "facesCount": n_faces,
        "photosWithFacesCount": int(n_photos_with_faces),
    }
    time_since_story = round(float(rng.exponential(20.0)), 2)  # days
    collection = {
        "collectionID": f"collection-{index:05d}",
        "timeSinceStory": time_since_story,
        "locationInfo": ({"name": place[0], "isLandmark": place[1], "longitude": place[2], "latitude": place[3]}
                         if place else None),
        "assetCounts": counts,
        "assetDetails": assets,
        "duplicateInfos": dupes,
    }

    quality = (0.9 * math.log(n_assets)
               + 3.0 * fav_rate
               + 2.5 * (sharpness - 0.7)
               + 2.0 * (brightness - 0.65)
               + (0.8 if place and place[1] else 0.3 if place else -0.4)
               - 3.0 * dup_rate
               - 4.0 * screenshot_rate
               + 1.5 * min(video_rate, 0.3)
               + 0.6 * math.tanh(time_since_story / 14.0)
               - 2.6)
    return collection, quality


def label(rng, quality):
    """1 when the collection is worth showing, with logistic label noise."""
    return int(rng.rand() < 1.0 / (1.0 + math.exp(-2.0 * quality)))
