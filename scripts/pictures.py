"""What the pictures of the documentation share: their colours on a dark page."""

DARK = {"#fafafa": "#161b22", "#fff": "#21262d", "#222": "#dbe2ea", "#555": "#98a3ae",
        "#dde1e6": "#30363d", "#345": "#8fa3b8", "#9ab": "#6b7c8d", "#789": "#8fa3b8",
        "#eef3f8": "#1c2a3a", "#f3f0e8": "#2d2a22",
        # the lines of plots
        "#0b5cad": "#6cb2ff", "#3f86cc": "#a5d1ff", "#b4451f": "#ff9a70", "#7a7a7a": "#b0b0b0",
        "#2e7d4f": "#6fd08c", "#8a4fa0": "#d29be6", "#a07a00": "#e3b341"}


def dark_style(picture):
    """The rules that give the fills and strokes of a picture their dark colours where the reader
    prefers those. Pages show the same file in both cases."""
    rules = "".join(f'[{kind}="{light}"]{{{kind}:{dark}}}' for light, dark in DARK.items()
                    for kind in ("fill", "stroke") if f'{kind}="{light}"' in picture)
    return f"@media(prefers-color-scheme:dark){{{rules}}}"
