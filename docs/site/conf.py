"""Settings of the site. scripts/docs passes the version and the folder of the reference's XML."""
import pathlib
import re
import sys

import furo

sys.path.insert(0, str(pathlib.Path(__file__).parent))

project = "libkovabackup"
html_title = "libkovabackup"
extensions = ["myst_parser", "breathe", "declarations"]
highlight_language = "text"
primary_domain = "cpp"
smartquotes = False
myst_heading_anchors = 4

breathe_default_project = "reference"
breathe_show_include = False

html_theme = "furo"
html_static_path = ["static"]
html_css_files = ["style.css"]
html_js_files = [("scripts/gumshoe-patched.js", {"priority": 190})]  # furo.js needs it
html_copy_source = False
html_show_copyright = False
html_show_sphinx = False
html_show_search_summary = False  # without a server, a page cannot read the pages that were found
pygments_style = "vs"
pygments_dark_style = "github-dark"


def dark_colours():
    """The theme's dark colours. In Debian's build only its button sets them, not the browser."""
    style = pathlib.Path(furo.__file__).parent / "theme/furo/static/styles/furo.css"
    block = re.search(r'body\[data-theme="dark"\] \{(.*?)\}', style.read_text(), re.S).group(1)
    return dict(re.findall(r"--([\w-]+): (.*?);", block))


html_theme_options = {"dark_css_variables": dark_colours()}
