"""Which steps a random sequence has."""
import random

from comparison import STUDIES

PATIENTS = ("Doe^1", "Doe^2", "Roe^1", "Roe^2")
LOCALES = ("C", "C.UTF-8", "de_DE.UTF-8")


def random_step(chance):
    """Anything; what is frequent builds archives, what is seldom breaks them."""
    study = lambda: chance.choice(STUDIES)
    sop = lambda: "9.%d" % chance.randrange(10)
    series = lambda of: "%s.%d" % (of, chance.randrange(2))
    name = lambda: "%s/%d" % (chance.choice("ab"), chance.randrange(7))
    folder = lambda: chance.choice((".", ".", "a", "b"))
    door = lambda *doors: chance.choice(doors)

    def content(uid):
        of = study()
        return "%s %s %s %s %02d" % (of, series(of), uid, chance.choice(PATIENTS), chance.randrange(20))

    def command():
        return chance.choice((
            lambda: "add " + folder(), lambda: "add " + folder(), lambda: "index " + folder(), lambda: "build",
            lambda: "build-all", lambda: "build-again", lambda: "settle", lambda: "sync " + study(),
            lambda: "edit kdd %s %s %s" % (study(), sop(), chance.choice(PATIENTS)), move, delete))()

    def move(*doors):
        of = study()
        to = chance.choice((of, study()))
        return "move %s %s %s %s %s" % (door(*doors or ("kdd",)), of, sop(), to, series(to))

    def delete():
        of = study()
        return "delete kdd %s %s" % (of, chance.choice(("- -", series(of) + " -", "- " + sop(), "- " + sop())))

    table = (
        (22, lambda: "write %s %s%s" % (name(), content("-" if chance.random() < 0.06 else sop()),
                                        " same-stamp" if chance.random() < 0.1 else "")),
        (2, lambda: "touch " + name()), (4, lambda: "unlink " + name()), (1, lambda: "unlink-stored %d" % chance.randrange(9)),
        (14, lambda: "add " + folder()), (6, lambda: "index " + folder()), (4, lambda: "build"), (5, lambda: "build-all"),
        (3, lambda: "build-again"), (3, lambda: "settle"), (4, lambda: "sync " + study()),
        (4, lambda: "stack %s%s" % (study(), chance.choice(("", " again")))),
        (5, lambda: "edit %s %s %s %s" % (door("kdd", "http", "http", "c"), study(), sop(), chance.choice(PATIENTS))),
        (5, lambda: move("kdd", "http", "http", "c")), (4, delete), (1, lambda: "delete http %s - -" % study()),
        (3, lambda: "delete-shown %s %s %d" % (door("kdd", "http"), study(), chance.randrange(9))),
        (9, lambda: "store %s %s" % (door("http", "http", "dimse"), content(sop()))),
        (3, lambda: "keep " + study()), (2, lambda: "restore " + study()), (1, lambda: "drop " + study()),
        (1, lambda: "swap %s %s" % (study(), study())), (1, lambda: "cut %s %d" % (study(), chance.randrange(60))),
        (1, lambda: "c-delete %s %s" % (study(), sop())), (0.5, lambda: "c-drop " + study()), (1, lambda: "c-read " + study()),
        (0.5, lambda: "compression " + chance.choice(("none", "zlib", "lzma"))),
        (0.5, lambda: "locale " + chance.choice(LOCALES)), (0.3, lambda: "same-uid " + chance.choice(("refuse", "replace"))),
        (0.3, lambda: "restart"), (0.3, lambda: "kill-server"),
        (2, lambda: "both %s + %s" % (command(), command())),
        (2, lambda: "kill %d %s" % (chance.randrange(40), command())))
    return chance.choices([each for _, each in table], [weight for weight, _ in table])[0]()


def random_sequence(seed, length):
    chance = random.Random(seed)
    return [random_step(chance) for _ in range(length)]
