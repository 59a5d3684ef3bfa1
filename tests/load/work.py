"""What clients do all the time: some store, some read, one changes what is stored."""
import email.parser
import json

from client import Client

JSON = {"Accept": "application/dicom+json"}
FRAME = {"Accept": 'multipart/related; type="application/octet-stream"; transfer-syntax="*"'}
OBJECT = {"Accept": 'application/dicom; transfer-syntax="*"'}


def place_of(image):
    return "/studies/%s/series/%s/instances/%s" % image


def stored_in(answer):
    """SOP Instance UIDs and addresses of what an answer tells as stored."""
    items = json.loads(answer).get("00081199", {}).get("Value", [])
    return {item["00081155"]["Value"][0]: item["00081190"]["Value"][0] for item in items}


def store(client, paths):
    """Study, series and UID of those that are told as stored."""
    parts = []
    for path in paths:
        with open(path, "rb") as file:
            parts.append(file.read())
    body = b"".join(b"--cut\r\nContent-Type: application/dicom\r\n\r\n" + part + b"\r\n" for part in parts) + b"--cut--"
    _, answer = client.ask("store", "/studies",
                           dict(JSON, **{"Content-Type": 'multipart/related; type="application/dicom"; boundary=cut'}),
                           "POST", body, lambda status, got: status == 200 and len(stored_in(got)) == len(parts))
    images = []
    for uid, address in stored_in(answer).items() if answer is not None else ():
        places = address.split("/")
        images.append((places[-5], places[-3], uid))
        with client.all.mutex:
            client.all.acknowledged[uid] = images[-1][:2]
    return images


def find(client, image):
    study, _, uid = image
    client.ask("search for an image", f"/studies/{study}/instances?SOPInstanceUID={uid}", JSON,
               is_good=lambda status, body: status == 200 and uid.encode() in body, is_moot=client.all.is_withdrawn(uid))


def upload(clients, number, files):
    """What is new comes over the first half of the time, so that the archive grows no more in the second; what is sent again
    is stored once."""
    client = Client(clients, number)
    sent = 0
    while not clients.over.is_set():
        paths = []
        for _ in range(client.random.randint(1, 5)):
            if sent < min(len(files), 1 + len(files) * 2 * clients.passed()):
                paths.append(files[sent])
                sent += 1
            else:
                paths.append(client.random.choice(files[:sent]))
        # Two objects of one UID in one request are one, of which one is told.
        for image in store(client, sorted(set(paths))):
            # At once, from whichever server is asked.
            find(client, image)


def read(clients, number):
    client = Client(clients, number)
    frames = {}
    while not clients.over.is_set():
        image = clients.random_image(client.random)
        if image is None:
            clients.over.wait(0.05)
            continue
        study, series, uid = image
        place, is_moot = place_of(image), clients.is_withdrawn(uid)
        what = client.random.randrange(6)
        if what == 0:
            client.ask("search for studies", "/studies?includefield=all&limit=50", JSON)
        elif what == 1:
            find(client, image)
        elif what == 2:
            client.ask("metadata of a series", f"/studies/{study}/series/{series}/metadata", JSON,
                       is_good=lambda status, body: status == 200 and isinstance(json.loads(body), list), is_moot=is_moot)
        elif what == 3:
            client.ask("metadata of an image", place + "/metadata", JSON,
                       is_good=lambda status, body: status == 200 and uid.encode() in body, is_moot=is_moot)
        elif what == 4:
            client.ask("object", place, OBJECT, is_good=lambda status, body: status == 200 and body[128:132] == b"DICM",
                       is_moot=is_moot)
        else:
            # Of an object without pixels there is none.
            got, content = client.ask("frame", place + "/frames/1", FRAME, is_good=lambda status, body: status in (200, 404))
            if got is not None and got.get("Content-Type", "").startswith("multipart"):
                whole = email.parser.BytesParser().parsebytes(
                    b"Content-Type: " + got["Content-Type"].encode() + b"\r\n\r\n" + content)
                pixels = whole.get_payload()[0].get_payload(decode=True)
                if frames.setdefault(uid, pixels) != pixels:
                    clients.fault(f"{place}/frames/1 is another one than before")


def change(clients, number, studies):
    """Has studies, each a list of files, to itself: stores them, corrects them, takes images and series out and sends them again.
    What it changed has to show at once."""
    client = Client(clients, number)
    # Each correction stays in the history of its images.
    rest = max(0.2, clients.seconds / 1000)
    path_of = {}
    for files in studies:
        for path in files:
            path_of.update((image, path) for image in store(client, [path]))
    turn = 0
    while path_of and not clients.over.wait(client.random.uniform(0, 2 * rest)):
        turn += 1
        image = client.random.choice(sorted(path_of))
        if client.random.random() < 0.6:
            correct(client, image[0], "%s^%d" % (client.random.choice(("Doe", "Roe", "Poe")), turn))
        else:
            some = [image] if client.random.random() < 0.7 else [other for other in path_of if other[:2] == image[:2]]
            take_out(client, some)
            store(client, [path_of[each] for each in some])
        shown(client, image)


def correct(client, study, name):
    """Sent again it is the same job."""
    job = json.dumps({"timestamp": "20240131120000", "login": "soak", "tags": [{"tag": "00100010", "value": name}]})
    _, answer = client.ask("correction", f"/studies/{study}/corrections?all=true",
                           {"Content-Type": "application/json", "Accept": "application/json"}, "POST", job.encode())
    if answer is not None:
        client.all.corrected[study] = {"00100010": {"vr": "PN", "Value": [{"Alphabetic": name}]}}


def take_out(client, images):
    """One image, or all of a series."""
    client.all.withdraw(uid for _, _, uid in images)
    place = place_of(images[0])
    if len(images) > 1:
        place = place[:place.index("/instances")]
    # A repeat of what was done has nothing to do.
    client.ask("deletion", place, {"Accept": "application/json"}, "DELETE",
               is_good=lambda status, body: status in (200, 404))
    client.ask("what was deleted", place + "/metadata", JSON, is_good=lambda status, body: status == 404)


def shown(client, image):
    """What was corrected, also in what was sent again."""
    expected = client.all.corrected.get(image[0], {}).items()
    client.ask("what was corrected", place_of(image) + "/metadata", JSON,
               is_good=lambda status, body: status == 200 and expected <= json.loads(body)[0].items())
