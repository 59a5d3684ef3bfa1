"""What a check has to find in an archive, by its model."""


def faults(model, study):
    """What a check has to name of the study, in words that it says."""
    wanted = model.listed_images(study)
    if not wanted:
        return ["tag file"] if study in model.there else []
    found = []
    if study in model.waiting:
        found.append("Study %s waits to be built" % study)
    if study not in model.shown:
        return found if study in model.waiting and study not in model.there else found + ["Study %s has" % study]
    if study not in model.waiting and study in model.spoiled:
        found.append("The tag file of study %s, " % study)
    for key, image in model.shown[study].items():
        file = model.disk.get(image.path)
        if file is None:
            found.append("Could not load " + image.path)
        elif model.corrected(image.path, file) != image.shows:
            found.append("Image " + key)
        elif study not in model.waiting and (key not in wanted or wanted[key].path != image.path):
            found.append("Image " + key)
    if study not in model.waiting:
        found += ["Image " + key for key in wanted if key not in model.shown[study]]
    return found


def all_faults(model):
    return [each for study in sorted(model.listed() | model.there) for each in faults(model, study)]


def is_settled(model, study):
    """Nothing waits for its time, nothing differs: another build makes the same bytes."""
    return (bool(model.listed_images(study)) and not faults(model, study) and
            study not in model.unsettled | model.marked | model.uncertain)
