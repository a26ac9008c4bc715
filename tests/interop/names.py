"""Names in many scripts, the same on every run, as volumes store them: decomposed."""

import random
import unicodedata

ALPHABETS = [
    "abcdefghijklmnopqrstuvwxyz ABCDEFGHIJKLMNOPQRSTUVWXYZ-_.,()'+=#@0123456789",
    "äöüßéèêñçåøœæÄÖÜÉÑabc",
    "αβγδεζηθικλμνξοπρστυφχψωάέήίόύώ",
    "абвгдежзийклмнопрстуфхцчшщъыьэюя",
    "漢字日本語中文図書館山川海空",
    "ひらがなカタカナがぎぐげごぱぴぷ",
    "한국어글자이름파일",
    "שלוםעברית",
    "مرحباملف",
    "हिन्दीफाइल",
    "ไทยภาษา",
    "😀🎵📁🌍𝒳𝔘",
]


def stored(text):
    return unicodedata.normalize("NFD", text)


def make_names(count, seed):
    """`count` names of which no two are equal when case is folded."""
    chance = random.Random(seed)
    seen = set()
    names = []
    while len(names) < count:
        alphabet = ALPHABETS[0] if chance.random() < 0.6 else chance.choice(ALPHABETS)
        text = "".join(chance.choice(alphabet) for _ in range(chance.randint(1, 24))).strip()
        text += str(len(names)) if chance.random() < 0.7 else ""
        name = stored(text)
        key = name.casefold()
        if not text or text in (".", "..") or key in seen:
            continue
        seen.add(key)
        names.append(name)
    return names
